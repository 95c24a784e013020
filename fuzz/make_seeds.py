#!/usr/bin/env python3
"""Writes the seed corpus of every fuzz target into fuzz/corpus/<target>/.

The seeds are the daemon's known edge cases. Run it again after changing this file;
files a campaign merged into the corpus (named by content hash) and the regress-*
files are left alone.
"""
import os
import sys

SEP = b"\xfe\xfe\xfe"
HERE = os.path.dirname(os.path.abspath(__file__))


def put(target, name, data):
    d = os.path.join(HERE, "corpus", target)
    os.makedirs(d, exist_ok=True)
    with open(os.path.join(d, "seed-" + name), "wb") as f:
        f.write(data)


def attok():
    lines = {
        "basic": b"ATQ0V1E", "none": b"A", "empty": b"", "action": b"AT%REBOOT",
        "read": b"AT+CCLK?", "test": b"AT#CLS=?", "set": b"AT+CSDF=1,2",
        "quoted-q": b'AT+EURC="a?"', "atq": b"AT?",
        "mixed": b'AT+X=1,"abc",  2', "quoted-int": b'AT+X="12"', "skip": b'AT+X="a"x,b',
        "open-quote": b'AT+X="abc', "empty-tok": b"AT+X=,5",
        "wide": b"AT+X=4294967297,-9223372036854775809,12abc", "lower": b'  at+cmgs="abc"  ',
        "blanks": b"     ", "tab": b"AT\t", "commas": b"AT+X=,,,,\"\",\",\"",
    }
    for i, (name, line) in enumerate(lines.items()):
        put("attok", name, bytes([i * 37 & 0xFF]) + line)


def dispatch():
    lines = [
        b"AT+CCLK?", b'AT+CCLK="26/12/06,08:00:00+08"', b"AT+CCLK=?", b"at+csdf=1,2", b"AT+CSDF?",
        b"AT+ESUO=9", b"AT+ESUO?", b"AT+CMEC=2,1,0", b"AT+CMEC?", b"ATE0", b"ATE1", b"AT+CMEE=1",
        b"AT^WIENABLE=1", b"AT^WIENABLE?", b"AT^WIMODE=1", b"AT^WIBAND=0", b"AT^WIFREQ=2412",
        b"AT^WIDATARATE=65", b"AT^WITXPOW=15", b"AT^WITX=1", b"AT^WIRX=1", b"AT^WIRPCKG?",
        b"AT^WIRPCKG=0", b"AT+USBCONFIG=1", b"AT+USBCONFIG?", b"AT+USBTETHERING=1", b"AT%REBOOT",
        b"AT@SCC", b"AT@GBV", b"AT^IINLIMIT=0", b"AT+VZWTOLKCFG=1", b"AT+VZWAPNE=1,1,\"x\"",
        b"AT%ECALL=1", b"MM+ANYTHING", b"AUD+LOOP=1", b"AT+EADP=1", b"AT^MMITESTENABLE=1",
        b"at*cit=key", b"AT%SUPPLEMENTARYSERVICE" + b" " * 20 + b"=1", b"AT%ECALL" + b"X" * 40, b"=AT+CCLK",
        b"AT+CCLK=\"99/99/99,99:99:99-99\"", b"AT+CSDF=2147483648,-1", b"AT+ESUO=" + b"9" * 30,
    ]
    for i, line in enumerate(lines):
        settings = (i * 5) & 0x0F
        answer = b"\r\nOK\r\n" if i % 2 else b"\r\nERROR\r\n"
        put("dispatch", "%02d" % i, bytes([settings]) + line + SEP + answer)
    put("dispatch", "wifi-ok", bytes([8]) + b"AT^WIENABLE=1" + SEP + b"AT^WIENABLE=1\r\nOK\r\n")
    put("dispatch", "wifi-silent", bytes([8]) + b"AT^WIENABLE=0" + SEP)


def reader():
    ADB, ROUTE, RELAY, MERGE, TEXT, OP12 = 1, 2, 4, 8, 16, 32
    frame = b"at^mmitest=" + bytes(range(1, 41))  # 51 bytes
    seeds = {
        "serial-at": (0, [b"AT\n"]),
        "serial-drop": (0, [b"A\n", b"\n", b"at+cclk\n"]),
        "serial-audio": (ROUTE, [b"AUD+LOOP=1\n"]),
        "serial-bs": (0, [b"AT+CX\x08CLK\r\n"]),
        "serial-frame-ok": (0, [frame]),
        "serial-frame-49": (0, [frame[:12] + frame[14:]]),
        "serial-frame-short": (0, [b"at^mmitest=\x01\x02\n", b"AT\n"]),
        "serial-ctrl-d": (0, [b"AT+CS\x04Q\n", b"\x04"]),
        "serial-sms-relay": (ROUTE, [b"AT+CMGS=\"123\"\n", b"\n", b"hello\x1a"]),
        "serial-sms-merge": (ROUTE | OP12 | TEXT, [b"AT+CMGF=1\n", b"AT+CMGS=\"123\"\n", b"\n", b"hi\x08i\n", b"there\x1a"]),
        "serial-sms-esc": (ROUTE | OP12, [b"AT+CMGS=12\n", b"0011\x1b"]),
        "serial-ate0": (ROUTE, [b"ATE0\n", b"AT+CCLK?\n", b"atv0\n", b"AT\n"]),
        "adb-split": (ADB, [b"A", b"T\r"]),
        "adb-two": (ADB, [b"AT\rAT+CCLK\r"]),
        "adb-long": (ADB, [b"A" * 3000, b"T" * 3200]),
        "adb-lf": (ADB, [b"AT\r\n", b"\nAT+CSDF?\r"]),
        "adb-sms-merge": (ADB | ROUTE | OP12 | TEXT, [b"AT+CMGS=\"123\",129\r", b"line one\r", b"end\x1a\r"]),
        "adb-sms-relay": (ADB | RELAY, [b"hello\x1a\r", b"\n"]),
        "adb-merge-held": (ADB | MERGE | TEXT, [b"at+cmgs=\"5551234\"", b"text\r", b"\x1a\r"]),
        "adb-merge-pdu": (ADB | MERGE, [b"AT+CMGS=23", b"0011000B91\x1b"]),
        "adb-frame": (ADB, [frame[:20], frame[20:]]),
        "adb-cit": (ADB | ROUTE, [b"AT*CIT_GACITF\r", b"AT*CIT_SN\r"]),
        "adb-powerkey": (ADB | ROUTE, [b"AT+POWERKEY\r", b"AT^MMITESTENABLE=1\r", b"AT^MMITESTENABLE=0\r"]),
    }
    for name, (flags, pieces) in seeds.items():
        put("reader", name, bytes([flags]) + SEP.join(pieces))


def writer():
    cases = {
        "ok": (0, b"\r\nOK\r\n"), "ok-num": (1, b"\r\nOK\r\n"), "bare": (0, b"OK"),
        "dialtone": (1, b"\r\nNO DIALTONE\r\n"), "lower": (1, b"ok"), "blank": (1, b"OK "),
        "ring": (1, b"\r\nRING\r\n"), "csq": (1, b"\r\n+CSQ: 20,99\r\n\r\nOK\r\n"),
        "nomodem": (0, b"ERROR:No Modem\0"), "prompt": (0, b"\r\n> \0"), "crlf": (0, b"\r\n"),
        "aud": (2, b"AUD+X\r\n\0"), "mm": (3, b"mm\0\r\n"), "nul": (0, b"AB\0CD"),
        "adb": (2 | 1, b"+CMGS: 5\r\n"),
    }
    for name, (mode, data) in cases.items():
        n = len(data)
        put("writer", name, bytes([mode & 3, n & 0xFF, n >> 8]) + data)
    for t in (0, 1, 4, 101, 0xFF):
        put("writer", "type-%d" % t, bytes([8, t, 0]))
    put("writer", "audio-raw", bytes([12, 6, 0]) + b"\0\r\n\x01\r\n")
    put("writer", "audio-adb", bytes([14, 3, 0]) + b"abc")
    put("writer", "negative", bytes([0x10, 4, 0]) + b"OKOK")
    put("writer", "long", bytes([0, 0x00, 0x18]) + b"x" * 6144)


def cit():
    record = bytearray(1024)
    record[202] = 1
    record[208] = ord("b")
    record[209] = 1
    rec = bytes(record)
    cases = {
        "sn2": (1, b"at*cit_Sn2", b"SN123"), "sn": (1, b"AT*CIT_SNX", b"S"),
        "imei": (1, b"AT*CIT_IMEI", b""), "sim-fail": (1, b"AT*CIT_SIM1", b"Fail no card"),
        "key-fail": (1, b"AT*CIT_KEY", b"Fail"), "lcd": (1, b"AT*CIT_LCD_Red", b"Fail"),
        "psensor": (1, b"AT*CIT_PSensor", b"0.2551"), "psensor-ok": (1, b"AT*CIT_PSensor", b"0.25"),
        "long-answer": (1, b"AT*CIT_Version", b"v" * 1100), "long-fail": (1, b"AT*CIT_SIM2", b"Fail" + b"x" * 1100),
        "hangup": (3, b"AT*CIT_BT", b""), "unreachable": (0, b"AT*CIT_GPS", b""),
        "readproinfo": (1, b"AT*CIT_ReadProInfo=202", b""), "readproinfo-out": (1, b"AT*CIT_ReadProInfo=1024", b""),
        "readproinfo-none": (1, b"AT*CIT_ReadProInfo", b""),
        "writeproinfo": (1, b"AT*CIT_WriteProInfo=209,257", b""), "writeproinfo-neg": (1, b"AT*CIT_WriteProInfo=-1,1", b""),
        "writeproinfo-none": (1, b"AT*CIT_WriteProInfo=5", b""),
        "wcitf-missing": (5, b"AT*CIT_WCITF", b""), "gacitf": (1, b"AT*CIT_GACITF", b""),
        "ccitf": (1, b"AT*CIT_CCITF", b""), "shutdown": (1, b"AT*CIT_ShutDown", b""),
        "start": (1, b"AT*CIT_Start", b""), "mmi1": (1, b"AT*CIT_ReadMMI1", b""),
        "userat": (1, b"AT*CIT_ReadUserAT", b""), "writeuserat": (1, b"AT*CIT_WriteUserAT", b""),
        "reset": (1, b"AT*CIT_ReadReset", b""),
    }
    for name, (flags, line, answer) in cases.items():
        citf = b"x0000001" if name != "ccitf" else b"x00"
        put("cit", name, bytes([flags]) + line + SEP + answer + SEP + rec + SEP + citf)


if __name__ == "__main__":
    for fn in (attok, dispatch, reader, writer, cit):
        fn()
    sys.exit(0)
