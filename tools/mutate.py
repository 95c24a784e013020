#!/usr/bin/env python3
"""Mutation testing for the daemon's sources (src/**/*.cpp).

Each mutant is one small change to one .cpp file under src/:

  cmp     a flipped comparison          <  <=   >  >=   ==  !=
  logic   a flipped logic operator      &&  ||
  const   a constant moved by one       n -> n+1 / n-1, true <-> false
  stmt    a dropped expression statement (replaced by "(void)0;")
  jump    break <-> continue
  return  "return EXPR;" -> "return 0;"

Sites are found by a small lexer that skips comments, string and character
literals, preprocessor lines (#include, #define, ...) and array sizes in
declarations. The tool never touches the repository it reads: it copies the
committed tree (git archive REV) into a private work directory under /tmp,
builds there, and for each mutant applies the change, rebuilds incrementally,
runs the suite fastest labels first (unit, platform, then e2e and the rest;
never soak or build), stops at the first failing group and restores the file.

  killed    a test failed or the suite ran out of time
  survived  every test passed
  invalid   the mutant did not compile (not counted in the score)
  missing   the sample line no longer matches the sources (not counted)

Score = killed / (killed + survived).

Typical use:
  tools/mutate.py --write-sample tools/mutants.txt --count 40 --seed 1
  tools/mutate.py --sample tools/mutants.txt          # runs the sample on HEAD
  tools/mutate.py --count 5 --seed 7 --filter reader  # a quick random trial
  tools/mutate.py --summarize RESULTS.jsonl           # the Markdown summary again
"""

import argparse
import json
import os
import random
import re
import shutil
import signal
import subprocess
import sys
import time

HERE = os.path.dirname(os.path.abspath(__file__))
DEFAULT_TREE = os.path.dirname(HERE)
ARROW = "\u2192"
KINDS = ("cmp", "logic", "const", "stmt", "jump", "return")

CMP_FLIP = {"<": "<=", "<=": "<", ">": ">=", ">=": ">", "==": "!=", "!=": "=="}
LOGIC_FLIP = {"&&": "||", "||": "&&"}

KEYWORDS = {
    "return", "break", "continue", "goto", "case", "default", "else", "do", "if",
    "for", "while", "switch", "typedef", "using", "static", "const", "struct",
    "enum", "class", "union", "sizeof", "delete", "new", "throw", "namespace",
    "template", "typename", "extern", "inline", "constexpr", "volatile",
}


# ---------------------------------------------------------------------------
# Lexing and site discovery


def mask_code(text):
    """Returns text with everything that is not code blanked out.

    Comments, string and character literals and preprocessor lines become
    spaces (newlines are kept), so offsets and line numbers stay the same.
    """
    out = list(text)
    n = len(text)
    i = 0
    line_start = True  # only whitespace seen since the last newline

    def blank(a, b):
        for k in range(a, b):
            if out[k] != "\n":
                out[k] = " "

    while i < n:
        c = text[i]
        if c == "\n":
            line_start = True
            i += 1
            continue
        if line_start and c == "#":
            # A directive runs to the end of the line, with backslash continuations.
            j = i
            while j < n:
                if text[j] == "\n" and text[j - 1] != "\\":
                    break
                j += 1
            blank(i, j)
            i = j
            continue
        if c in " \t\r":
            i += 1
            continue
        line_start = False
        if text.startswith("//", i):
            j = text.find("\n", i)
            j = n if j < 0 else j
            blank(i, j)
            i = j
        elif text.startswith("/*", i):
            j = text.find("*/", i + 2)
            j = n if j < 0 else j + 2
            blank(i, j)
            i = j
        elif c == "R" and text.startswith('R"', i) and (i == 0 or not (text[i - 1].isalnum() or text[i - 1] == "_")):
            m = re.match(r'R"([^(\s]*)\(', text[i:])
            if m:
                end = text.find(")" + m.group(1) + '"', i)
                j = n if end < 0 else end + len(m.group(1)) + 2
                blank(i, j)
                i = j
            else:
                i += 1
        elif c in "\"'":
            if c == "'" and i > 0 and text[i - 1].isalnum():
                i += 1  # digit separator such as 1'000
                continue
            j = i + 1
            while j < n and text[j] != c and text[j] != "\n":
                j += 2 if text[j] == "\\" else 1
            j = min(j + 1, n)
            blank(i, j)
            i = j
        else:
            i += 1
    return "".join(out)


DECL_BEFORE_BRACKET = re.compile(r"([A-Za-z_][\w:]*)[\s\*&]+([A-Za-z_]\w*)\s*(\[[^\]]*\]\s*)*$")
DECL_START = re.compile(
    r"^(?:(?:static|const|constexpr|unsigned|signed|struct|volatile|extern)\s+)*"
    r"[A-Za-z_][\w:]*(?:<[^;]*>)?[\s\*&]+[A-Za-z_]\w*\s*(?:=|;|\[|\(|,|\{)")
LOG_CALL = re.compile(r"^(?:LOG|ALOG|SLOG|RLOG)\w*\s*\(")


def in_array_size(mline, col0):
    """True when the literal at col0 of the masked line sizes an array in a declaration."""
    before = mline[:col0].rstrip()
    if not before.endswith("["):
        return False
    if not mline[col0:].lstrip("0123456789xXabcdefABCDEFuUlL").lstrip().startswith("]"):
        return False
    m = DECL_BEFORE_BRACKET.search(before[:-1])
    return bool(m) and m.group(1) not in KEYWORDS


def const_replacements(lit):
    m = re.match(r"^(0[xX][0-9a-fA-F]+|\d+)([uUlL]*)$", lit)
    if not m:
        return []
    body, suffix = m.groups()
    if body.lower().startswith("0x"):
        v = int(body, 16)
        width = len(body) - 2
        upper = any(ch.isupper() for ch in body[2:])
        fmt = lambda x: body[:2] + (("%0*X" if upper else "%0*x") % (width, x))
    elif len(body) > 1 and body.startswith("0"):
        return []  # octal; rare and easy to get wrong
    else:
        v = int(body)
        fmt = str
    reps = [fmt(v + 1) + suffix]
    if v > 0:
        reps.append(fmt(v - 1) + suffix)
    return reps


def find_sites(relpath, text):
    """Every candidate mutation site of one file, as dicts."""
    masked = mask_code(text)
    lines = text.split("\n")
    mlines = masked.split("\n")
    sites = []

    def add(lineno, col0, kind, orig, reps):
        for rep in reps:
            sites.append({"file": relpath, "line": lineno, "col": col0 + 1, "kind": kind,
                          "orig": orig, "repl": rep, "context": lines[lineno - 1].strip()})

    prev_code = ""
    for idx, ml in enumerate(mlines):
        lineno = idx + 1
        if not ml.strip():
            continue
        for m in re.finditer(r"(?<=\s)(<=|>=|==|!=|<|>)(?=\s)", ml):
            add(lineno, m.start(), "cmp", m.group(1), [CMP_FLIP[m.group(1)]])
        for m in re.finditer(r"(?<=\s)(&&|\|\|)(?=\s)", ml):
            add(lineno, m.start(), "logic", m.group(1), [LOGIC_FLIP[m.group(1)]])
        for m in re.finditer(r"(?<![\w.'])(0[xX][0-9a-fA-F]+|\d+)([uUlL]*)(?![\w.'])", ml):
            if in_array_size(ml, m.start()):
                continue
            add(lineno, m.start(), "const", m.group(0), const_replacements(m.group(0)))
        for m in re.finditer(r"\b(true|false)\b", ml):
            add(lineno, m.start(), "const", m.group(1), ["false" if m.group(1) == "true" else "true"])

        stripped = ml.strip()
        indent = len(ml) - len(ml.lstrip())
        whole = lines[idx].strip()
        # Statement-level kinds need the whole statement on this line and a
        # statement boundary before it.
        boundary = (prev_code == "" or prev_code[-1] in ";{}:)" or prev_code.endswith("else")
                    or prev_code.endswith("do"))
        single = (stripped.endswith(";") and "{" not in stripped and "}" not in stripped
                  and stripped.count("(") == stripped.count(")") and stripped.count(";") == 1
                  and whole == lines[idx][indent:].rstrip() and whole.endswith(";"))
        if boundary and single:
            if stripped == "break;":
                add(lineno, indent, "jump", "break;", ["continue;"])
            elif stripped == "continue;":
                add(lineno, indent, "jump", "continue;", ["break;"])
            elif stripped.startswith("return ") or stripped.startswith("return("):
                expr = stripped[len("return"):-1].strip()
                # Literals are the const kind's; a named constant may well be 0 already.
                if expr and not re.match(r"^-?(\d+|0[xX][0-9a-fA-F]+|true|false|NULL|nullptr|[A-Z][A-Z0-9_]*)$", expr):
                    if whole.endswith(";") and "//" not in whole and "/*" not in whole:
                        add(lineno, indent, "return", whole, ["return 0;"])
            else:
                first = re.match(r"^[A-Za-z_]\w*", stripped)
                is_expr = (stripped[0] in "*+-" or first) and not DECL_START.match(stripped)
                if first and first.group(0) in KEYWORDS:
                    is_expr = False
                if is_expr and not LOG_CALL.match(stripped) and not stripped.startswith("assert"):
                    effect = "(" in stripped or re.search(r"(?<![=!<>])=(?!=)|\+\+|--", stripped)
                    if effect and "//" not in whole and "/*" not in whole:
                        add(lineno, indent, "stmt", whole, ["(void)0;"])
        prev_code = stripped if stripped else prev_code
    return sites


def site_label(s):
    return "%s:%d:%d:%s:%s%s%s" % (s["file"], s["line"], s["col"], s["kind"], s["orig"], ARROW, s["repl"])


def parse_sample_line(raw):
    raw = raw.rstrip("\n")
    if not raw.strip() or raw.lstrip().startswith("#"):
        return None
    label, _, ctx = raw.partition("\t")
    ctx = ctx[2:] if ctx.startswith("| ") else ctx
    f, line, col, kind, rest = label.split(":", 4)
    orig, repl = rest.split(ARROW, 1)
    return {"file": f, "line": int(line), "col": int(col), "kind": kind, "orig": orig,
            "repl": repl, "context": ctx}


def locate(text, site):
    """Offset of the mutant's original text, following the line if the file moved."""
    lines = text.split("\n")
    starts = [0]
    for ln in lines[:-1]:
        starts.append(starts[-1] + len(ln) + 1)

    def at(lineno, col):
        if 1 <= lineno <= len(lines):
            off = starts[lineno - 1] + col - 1
            if text[off:off + len(site["orig"])] == site["orig"]:
                return off
        return None

    off = at(site["line"], site["col"])
    if off is not None and (not site["context"] or lines[site["line"] - 1].strip() == site["context"]):
        return off
    if not site["context"]:
        return off
    # The file changed: find the nearest line with the same text, same spot in it.
    old_line_text = site["context"]
    best = None
    for i, ln in enumerate(lines):
        if ln.strip() == old_line_text:
            if best is None or abs(i + 1 - site["line"]) < abs(best - site["line"]):
                best = i + 1
    if best is None:
        return None
    # Same column when the indentation did not change, else the nearest occurrence.
    ln = lines[best - 1]
    candidates = [m.start() for m in re.finditer(re.escape(site["orig"]), ln)]
    if not candidates:
        return None
    pick = min(candidates, key=lambda c: abs(c - (site["col"] - 1)))
    site["line"], site["col"] = best, pick + 1
    return starts[best - 1] + pick


# ---------------------------------------------------------------------------
# The private copy


def log(msg):
    print("[mutate %s] %s" % (time.strftime("%H:%M:%S"), msg), flush=True)


def run(cmd, cwd=None, timeout=None, env=None):
    """Runs cmd in its own process group; kills the whole group on timeout."""
    p = subprocess.Popen(cmd, cwd=cwd, env=env, stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
                         start_new_session=True, text=True, errors="replace")
    try:
        out, _ = p.communicate(timeout=timeout)
        return p.returncode, out, False
    except subprocess.TimeoutExpired:
        try:
            os.killpg(p.pid, signal.SIGKILL)
        except ProcessLookupError:
            pass
        out, _ = p.communicate()
        return -9, out, True


def kill_strays(work):
    """Kills processes left running from binaries of the work directory (a hung daemon)."""
    mine = os.getuid()
    work = os.path.realpath(work)
    for pid in os.listdir("/proc"):
        if not pid.isdigit() or int(pid) == os.getpid():
            continue
        try:
            if os.stat("/proc/" + pid).st_uid != mine:
                continue
            exe = os.readlink("/proc/%s/exe" % pid)
        except OSError:
            continue
        if exe.startswith(work + "/") or exe.startswith(os.path.realpath(work + "/build") + "/"):
            try:
                os.kill(int(pid), signal.SIGKILL)
            except OSError:
                pass


class Workspace:
    def __init__(self, args):
        self.tree = os.path.abspath(args.tree)
        self.work = os.path.abspath(args.work)
        if not os.path.basename(self.work).startswith("mutate-") or os.path.dirname(self.work) != "/tmp":
            sys.exit("--work must be a directory /tmp/mutate-*")
        self.src = os.path.join(self.work, "tree")
        self.build = os.path.join(self.work, "build")
        self.jobs = str(args.jobs)
        self.commit = subprocess.check_output(["git", "-C", self.tree, "rev-parse", args.rev], text=True).strip()
        self.subject = subprocess.check_output(
            ["git", "-C", self.tree, "log", "-1", "--format=%h %s", self.commit], text=True).strip()

    def prepare(self, reuse):
        stamp = os.path.join(self.work, "COMMIT")
        old = open(stamp).read().strip() if os.path.exists(stamp) else None
        if reuse and old and os.path.isdir(self.src):
            # Also undoes a mutant left behind by a run that was killed.
            self.refresh(old)
            with open(stamp, "w") as f:
                f.write(self.commit + "\n")
        else:
            if os.path.exists(self.work):
                shutil.rmtree(self.work)
            os.makedirs(self.src)
            log("copying %s at %s into %s" % (self.tree, self.commit[:10], self.src))
            archive = subprocess.Popen(["git", "-C", self.tree, "archive", self.commit], stdout=subprocess.PIPE)
            subprocess.check_call(["tar", "-x", "-C", self.src], stdin=archive.stdout)
            if archive.wait() != 0:
                sys.exit("git archive failed")
            with open(stamp, "w") as f:
                f.write(self.commit + "\n")
        if not os.path.exists(os.path.join(self.build, "CMakeCache.txt")):
            gen = ["-G", "Ninja"] if shutil.which("ninja") else []
            subprocess.check_call(["cmake", "-S", self.src, "-B", self.build] + gen +
                                  ["-DCMAKE_BUILD_TYPE=RelWithDebInfo", "-DTOLKD_BUILD_BENCH=OFF"],
                                  stdout=subprocess.DEVNULL)
        t0 = time.time()
        log("building the unmutated tree (a fresh build takes a while)")
        rc, out, _ = run(["cmake", "--build", self.build, "-j", self.jobs])
        if rc != 0:
            sys.stdout.write(out[-4000:])
            sys.exit("the unmutated tree does not build")
        log("built in %.0f s" % (time.time() - t0))

    def refresh(self, old):
        """Brings the copy from commit old to ours, rewriting only changed files (so the build stays incremental)."""
        log("updating %s from %s to %s" % (self.src, old[:10], self.commit[:10]) if old != self.commit
            else "reusing %s at %s" % (self.src, self.commit[:10]))
        incoming = os.path.join(self.work, "incoming")
        if os.path.exists(incoming):
            shutil.rmtree(incoming)
        os.makedirs(incoming)
        archive = subprocess.Popen(["git", "-C", self.tree, "archive", self.commit], stdout=subprocess.PIPE)
        subprocess.check_call(["tar", "-x", "-C", incoming], stdin=archive.stdout)
        if archive.wait() != 0:
            sys.exit("git archive failed")

        def tracked(rev):
            out = subprocess.check_output(["git", "-C", self.tree, "ls-tree", "-r", "--name-only", rev], text=True)
            return set(out.splitlines())

        new_files = tracked(self.commit)
        changed = 0
        for rel in sorted(new_files):
            a, b = os.path.join(incoming, rel), os.path.join(self.src, rel)
            if os.path.islink(a) or not os.path.isfile(a):
                continue
            if os.path.isfile(b) and open(a, "rb").read() == open(b, "rb").read():
                continue
            os.makedirs(os.path.dirname(b), exist_ok=True)
            shutil.copy2(a, b)
            os.utime(b)  # newer than any object built from the old content
            changed += 1
        gone = tracked(old) - new_files
        for rel in gone:
            try:
                os.remove(os.path.join(self.src, rel))
            except OSError:
                pass
        shutil.rmtree(incoming)
        log("%d files changed, %d removed" % (changed, len(gone)))

    def rebuild(self, target=None, timeout=900):
        cmd = ["cmake", "--build", self.build, "-j", self.jobs]
        if target:
            cmd += ["--target", target]
        rc, out, timed_out = run(cmd, timeout=timeout)
        return rc == 0 and not timed_out, out


# The suite in order of speed. Each group is a list of ctest label arguments.
GROUPS = [
    ("unit", ["-L", "^unit$"]),
    ("platform", ["-L", "^platform$"]),
    ("e2e+rest", ["-LE", "^(unit|platform|soak|build)$"]),
]
# The soak's "soak" label is lost by gtest_discover_tests (only "e2e" arrives),
# so it is left out by name as well.
DEFAULT_EXCLUDE = r"^Soak\."


def failed_tests(out):
    names = []
    grab = False
    for ln in out.splitlines():
        if "The following tests FAILED" in ln or "The following tests did not run" in ln:
            grab = True
            continue
        if grab:
            m = re.match(r"^\s*\d+\s*-\s*(\S+)", ln)
            if m:
                names.append(m.group(1))
            elif ln.strip() and not ln.startswith("\t") and not ln.startswith(" "):
                grab = False
    return names


def run_suite(ws, deadline, test_timeout, exclude, stop_on_failure=True):
    """Runs the groups in order. Returns (passed, group, failed test names, seconds)."""
    t0 = time.time()
    for name, sel in GROUPS:
        remaining = deadline - time.time()
        if remaining <= 0:
            return False, name, ["(mutant timeout)"], time.time() - t0
        cmd = ["ctest", "--test-dir", ws.build, "-j", ws.jobs, "--timeout", str(test_timeout),
               "--output-on-failure"] + sel
        if stop_on_failure:
            cmd.append("--stop-on-failure")
        if exclude:
            cmd += ["-E", exclude]
        rc, out, timed_out = run(cmd, timeout=remaining)
        kill_strays(ws.work)
        if timed_out:
            return False, name, ["(mutant timeout)"], time.time() - t0
        if rc != 0:
            if "No tests were found" in out:
                continue
            return False, name, failed_tests(out) or ["(ctest rc %d)" % rc], time.time() - t0
    return True, None, [], time.time() - t0


# ---------------------------------------------------------------------------
# Sampling


def code_lines(text):
    return sum(1 for ln in mask_code(text).split("\n") if ln.strip())


def all_sources(root):
    out = []
    for dirpath, _, files in os.walk(os.path.join(root, "src")):
        for f in files:
            if f.endswith(".cpp"):
                out.append(os.path.relpath(os.path.join(dirpath, f), root))
    return sorted(out)


def allocate(weights, count):
    """Largest-remainder split of count over files by weight."""
    total = float(sum(weights.values())) or 1.0
    exact = {f: count * w / total for f, w in weights.items()}
    alloc = {f: int(v) for f, v in exact.items()}
    rest = count - sum(alloc.values())
    for f in sorted(exact, key=lambda f: exact[f] - alloc[f], reverse=True)[:rest]:
        alloc[f] += 1
    return alloc


def draw(root, count, seed, filt):
    """An ordered list of candidate sites per file: the first `alloc` ones are the picks."""
    rng = random.Random(seed)
    per_file = {}
    weights = {}
    for rel in all_sources(root):
        text = open(os.path.join(root, rel), encoding="utf-8", errors="replace").read()
        sites = [s for s in find_sites(rel, text) if not filt or re.search(filt, site_label(s))]
        if sites:
            per_file[rel] = sites
            weights[rel] = code_lines(text)
    alloc = allocate(weights, count)
    plan = {}
    for rel in sorted(per_file):
        sites = per_file[rel]
        by_kind = {}
        for s in sites:
            by_kind.setdefault(s["kind"], []).append(s)
        for k in by_kind:
            rng.shuffle(by_kind[k])
        kinds = sorted(by_kind)
        rng.shuffle(kinds)
        # Round-robin over the kinds so one file's picks mix them.
        ordered = []
        seen_pos = set()
        while any(by_kind.values()):
            for k in kinds:
                while by_kind[k]:
                    s = by_kind[k].pop()
                    key = (s["line"], s["col"])
                    if key in seen_pos:
                        continue  # one mutant per spot (a literal has two replacements)
                    seen_pos.add(key)
                    ordered.append(s)
                    break
        plan[rel] = (alloc.get(rel, 0), ordered)
    return plan


# ---------------------------------------------------------------------------
# Applying a mutant


def apply(ws, site):
    path = os.path.join(ws.src, site["file"])
    if not os.path.exists(path):
        return None
    text = open(path, encoding="utf-8").read()
    off = locate(text, site)
    if off is None:
        return None
    mutated = text[:off] + site["repl"] + text[off + len(site["orig"]):]
    with open(path, "w", encoding="utf-8") as f:
        f.write(mutated)
    return text


def restore(ws, site, text):
    with open(os.path.join(ws.src, site["file"]), "w", encoding="utf-8") as f:
        f.write(text)


def compiles(ws, site):
    """Applies the mutant, compiles the daemon library, restores. True when it built."""
    original = apply(ws, site)
    if original is None:
        return False
    try:
        ok, _ = ws.rebuild("tolkd_daemon" if not site["file"].endswith("core/main.cpp") else "tolkd", timeout=600)
    finally:
        restore(ws, site, original)
    return ok


def write_sample(args, ws):
    ws.prepare(args.reuse)
    plan = draw(ws.src, args.count, args.seed, args.filter)
    chosen = []
    for rel in sorted(plan):
        want, ordered = plan[rel]
        got = 0
        for s in ordered:
            if got >= want:
                break
            if args.no_compile_check or compiles(ws, s):
                chosen.append(s)
                got += 1
                log("sample %2d  %s" % (len(chosen), site_label(s)))
            else:
                log("invalid, drawing another: %s" % site_label(s))
    ws.rebuild()  # leave the build matching the unmutated tree
    with open(args.write_sample, "w") as f:
        f.write("# Mutants for tools/mutate.py, one per line: file:line:column:kind:original%sreplacement\n" % ARROW)
        f.write("# after a tab, the source line it was drawn from (used to follow the line if the file moves).\n")
        f.write("# Drawn with --seed %d --count %d%s from %s; each one compiled there.\n"
                % (args.seed, args.count, " --filter %s" % args.filter if args.filter else "", ws.subject))
        for s in chosen:
            f.write("%s\t| %s\n" % (site_label(s), s["context"]))
    log("wrote %d mutants to %s" % (len(chosen), args.write_sample))


# ---------------------------------------------------------------------------
# Running


def summarize(results, out=sys.stdout):
    meta = next((r for r in results if r.get("type") == "run"), {})
    muts = [r for r in results if r.get("type") == "mutant"]
    killed = [r for r in muts if r["status"] == "killed"]
    survived = [r for r in muts if r["status"] == "survived"]
    invalid = [r for r in muts if r["status"] == "invalid"]
    missing = [r for r in muts if r["status"] == "missing"]
    valid = len(killed) + len(survived)
    end = next((r for r in results if r.get("type") == "end"), {})
    out.write("commit:   %s\n" % meta.get("subject", "?"))
    out.write("mutants:  %d (killed %d, survived %d, invalid %d, missing %d)\n"
              % (len(muts), len(killed), len(survived), len(invalid), len(missing)))
    if valid:
        out.write("score:    %d / %d = %.0f%%\n" % (len(killed), valid, 100.0 * len(killed) / valid))
    if end:
        out.write("run time: %.0f min\n" % (end.get("seconds", 0) / 60.0))
    if survived:
        out.write("survivors:\n")
        for r in survived:
            out.write("  %s:%d:%s  [%s] %s %s %s" % (r["file"], r["line"], r.get("col", "?"), r["kind"], r["orig"],
                                                    ARROW, r["repl"]))
            out.write("   in: %s\n" % r["context"] if r.get("context") else "\n")
    for r in invalid + missing:
        out.write("  %s: %s\n" % (r["status"], r["site"]))


def run_mutants(args, ws):
    if args.sample:
        sites = [s for s in (parse_sample_line(l) for l in open(args.sample)) if s]
    else:
        sites = []
        plan = draw(os.path.join(args.tree), args.count, args.seed, args.filter)
        for rel in sorted(plan):
            want, ordered = plan[rel]
            sites.extend(ordered[:want])
    if args.filter:
        sites = [s for s in sites if re.search(args.filter, site_label(s))]
    if args.count and args.sample:
        sites = sites[:args.count]
    if not sites:
        sys.exit("no mutants to run")

    ws.prepare(args.reuse)
    results_path = args.results or "/tmp/mutate-results/%s-%s.jsonl" % (
        ws.commit[:10], time.strftime("%Y%m%d-%H%M%S"))
    os.makedirs(os.path.dirname(os.path.abspath(results_path)), exist_ok=True)
    res = open(results_path, "w")
    records = []

    def emit(rec):
        records.append(rec)
        res.write(json.dumps(rec) + "\n")
        res.flush()

    t_start = time.time()
    emit({"type": "run", "commit": ws.commit, "subject": ws.subject, "sample": args.sample,
          "seed": None if args.sample else args.seed, "count": len(sites),
          "started": time.strftime("%Y-%m-%dT%H:%M:%SZ", time.gmtime())})

    exclude = args.exclude
    if not args.no_baseline:
        log("baseline: the whole suite (without soak and build) on the unmutated tree")
        ok, _, failed, secs = run_suite(ws, time.time() + args.baseline_timeout, args.test_timeout, exclude,
                                        stop_on_failure=False)
        log("baseline %s in %.0f s%s" % ("passed" if ok else "FAILED", secs,
                                          "" if ok else ": " + " ".join(failed)))
        if not ok:
            if any(f.startswith("(") for f in failed):
                sys.exit("the baseline did not finish; fix the suite or raise --baseline-timeout")
            exclude = "|".join([e for e in [exclude] if e] + ["^%s$" % re.escape(f) for f in failed])
            log("those tests are left out of every mutant run")
        emit({"type": "baseline", "passed": ok, "failed": failed, "seconds": round(secs, 1), "exclude": exclude})

    for i, site in enumerate(sites, 1):
        label = site_label(site)
        rec = {"type": "mutant", "n": i, "site": label, "file": site["file"], "line": site["line"],
               "col": site["col"], "kind": site["kind"], "orig": site["orig"], "repl": site["repl"],
               "context": site["context"]}
        t0 = time.time()
        original = apply(ws, site)
        if original is None:
            rec.update(status="missing")
            log("%2d/%d missing   %s" % (i, len(sites), label))
            emit(rec)
            continue
        rec["line"], rec["col"] = site["line"], site["col"]  # where it was found in this commit
        try:
            ok, out = ws.rebuild(timeout=args.timeout)
            rec["build_s"] = round(time.time() - t0, 1)
            if not ok:
                rec.update(status="invalid", error=next(
                    (l for l in out.splitlines() if "error" in l), "")[:300])
            else:
                passed, group, failed, secs = run_suite(ws, time.time() + args.timeout, args.test_timeout, exclude)
                rec["test_s"] = round(secs, 1)
                if passed:
                    rec.update(status="survived")
                else:
                    rec.update(status="killed", group=group, killed_by=failed[:5])
        finally:
            restore(ws, site, original)
        log("%2d/%d %-9s %s%s  (%.0f s)" % (i, len(sites), rec["status"], label,
                                           "  by " + ",".join(rec.get("killed_by", [])[:2]) if rec["status"] == "killed" else "",
                                           time.time() - t0))
        emit(rec)

    ws.rebuild()
    emit({"type": "end", "seconds": round(time.time() - t_start, 1)})
    res.close()
    print()
    summarize(records)
    print("results:  %s" % results_path)


def main():
    ap = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--tree", default=DEFAULT_TREE, help="repository to copy (default: %(default)s)")
    ap.add_argument("--rev", default="HEAD", help="commit to copy (default: HEAD, never uncommitted work)")
    ap.add_argument("--seed", type=int, default=1)
    ap.add_argument("--count", type=int, default=0, help="mutants to draw (or the first N of --sample)")
    ap.add_argument("--sample", help="run the mutants listed in this file")
    ap.add_argument("--write-sample", metavar="FILE", help="draw --count mutants that compile, write them, stop")
    ap.add_argument("--no-compile-check", action="store_true", help="with --write-sample: do not compile each one")
    ap.add_argument("--filter", help="regex on file:line:col:kind:change; keeps matching mutants only")
    ap.add_argument("--timeout", type=int, default=600, help="seconds per mutant for the build and the suite")
    ap.add_argument("--test-timeout", type=int, default=120, help="ctest timeout of a test without its own")
    ap.add_argument("--baseline-timeout", type=int, default=1800)
    ap.add_argument("--exclude", default=DEFAULT_EXCLUDE,
                    help="ctest -E regex of test names never run (default: %(default)s, the soak)")
    ap.add_argument("--no-baseline", action="store_true", help="skip the unmutated run of the suite")
    ap.add_argument("--work", default="/tmp/mutate-work", help="private copy and build (/tmp/mutate-*)")
    ap.add_argument("--reuse", action="store_true", help="keep the work dir if it holds the same commit")
    ap.add_argument("--results", help="JSON lines output (default /tmp/mutate-results/COMMIT-TIME.jsonl)")
    ap.add_argument("--jobs", type=int, default=2)
    ap.add_argument("--list", action="store_true", help="print every candidate site of the tree and stop")
    ap.add_argument("--summarize", metavar="RESULTS", help="print the summary of a results file and stop")
    args = ap.parse_args()

    if args.summarize:
        summarize([json.loads(l) for l in open(args.summarize) if l.strip()])
        return
    if args.list:
        for rel in all_sources(args.tree):
            for s in find_sites(rel, open(os.path.join(args.tree, rel), encoding="utf-8").read()):
                if not args.filter or re.search(args.filter, site_label(s)):
                    print(site_label(s))
        return

    signal.signal(signal.SIGTERM, lambda *_: sys.exit(143))  # restore the mutated file on the way out
    os.nice(19 - os.nice(0))  # the machine is shared: lowest priority for us and every child
    ws = Workspace(args)
    if args.write_sample:
        if not args.count:
            sys.exit("--write-sample needs --count")
        write_sample(args, ws)
    else:
        if not args.sample and not args.count:
            sys.exit("give --sample FILE or --count N")
        run_mutants(args, ws)


if __name__ == "__main__":
    main()
