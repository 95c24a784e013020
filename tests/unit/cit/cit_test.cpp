// The CIT commands: those the daemon answers itself (the product-information
// record, the result file) and those passed to the test application, against an
// in-test application on the abstract socket the daemon connects to.
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <memory>

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "cit/cit_cmd.h"
#include "cit/pro_info.h"
#include "host_capture.h"

namespace {

const char kStore[] = "/nvram/PRODUCT_INFO";
const std::string kAppUidProperty = std::string("/properties/") + CIT_APP_UID_PROPERTY;

// The test application in a child process, on the abstract socket the daemon
// The test application in a child process, on the abstract socket the daemon
// connects to: one word (and its NUL) per read, noted in /app/heard and answered
// with the file /app/WORD of the device root ("OK" without one), sent in two
// pieces where the file has a "|". Ending it ends its links, as a restart does.
class TestApp {
public:
    explicit TestApp(const TestRoot &root) {
        int listenFd = tolk_local_server(CIT_SOCKET_NAME, ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM, 4);
        EXPECT_GE(listenFd, 0);
        pid_ = fork();
        if (pid_ == 0) {
            char buf[256] = {};
            for (int conn; (conn = accept(listenFd, nullptr, nullptr)) >= 0; close(conn)) {
                for (ssize_t n; (n = read(conn, buf, sizeof(buf) - 1)) > 0; memset(buf, 0, sizeof(buf))) {
                    std::ofstream(root.at("/app/heard"), std::ios::app) << buf << "\n";
                    const std::string word = std::string("/app/") + buf;
                    const std::string text = root.exists(word) ? root.read(word) : "OK";
                    const size_t cut = std::min(text.find('|'), text.size());
                    (void)!send(conn, text.data(), cut, MSG_NOSIGNAL);
                    if (cut == text.size()) continue;
                    usleep(5 * 1000);  // traffic shaping, not a wait: the link cuts the answer
                    (void)!send(conn, text.data() + cut + 1, text.size() - cut - 1, MSG_NOSIGNAL);
                }
            }
            _exit(0);
        }
        close(listenFd);
    }
    ~TestApp() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }

private:
    pid_t pid_;
};

class CitTest : public LinkTest {
protected:
    // The device build names the test application's uid; here it is ours.
    void SetUp() override {
        LinkTest::SetUp();
        root.write(kAppUidProperty, std::to_string(getuid()));
    }
    void TearDown() override {
        closeFd(sock_id);
        LinkTest::TearDown();
    }
    // Runs a line; gives what the host received.
    std::string ask(const std::string &line, int result = 0) {
        std::string buf = line;
        EXPECT_EQ(result, cit_test_pase(&buf[0])) << line;
        return host.take();
    }
};
using CitLocal = CitTest;
using CitForward = CitTest;

std::string pattern(const std::string &head, size_t n) {
    std::string s = head;
    while (s.size() < n) s.push_back(static_cast<char>('a' + s.size() % 26));
    return s.substr(0, n);
}

// The host bytes for a forwarded command's answer text and verdict.
std::string framedVerdict(const std::string &text, bool ok) {
    return (text.empty() ? "" : "\r\n" + text) + (ok ? "\r\nOK\r\n" : "\r\nERROR\r\n");
}

}  // namespace

// The station records a pass for every OK: a flag that did not reach the store is
// an error, a stored one is answered as always. (AT*CIT_WriteProInfo both ways,
// and AT*CIT_WriteUserAT on a record of the wrong shape: cit.tx.)
TEST_F(CitLocal, FlagWritesAnswerOkOnlyWhenStored) {
    EXPECT_EQ("\r\nERROR\r\n", ask("AT*CIT_WRITEUSERAT")) << "no store";
    root.write(kStore, std::string(PRODUCT_INFO_SIZE, '\x01'));
    EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", ask("AT*CIT_WRITEUSERAT"));
    EXPECT_EQ(0, getFlag(FLAG_USER_AT));
    // Blanks and quotes around a number are taken as the tokenizer takes them.
    EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_WRITEPROINFO= 7 ,\"200\""));
    EXPECT_EQ(200, getFlag(7));
    // A run whose mark the property store did not take has not started.
    std::filesystem::remove_all(root.at("/properties"));
    root.write("/properties", "not a folder");
    EXPECT_EQ("\r\nERROR\r\n", ask("AT*CIT_START"));
}

// A file too short to hold character 7 is written whole, never padded with NULs,
// and one that can be neither opened nor created answers ERROR: root_faults.tx.
TEST_F(CitLocal, ResultFileEdges) {
    // An existing file keeps its other characters; only character 7 changes, and
    // a file of 7 characters has room for it; a shorter one is written whole.
    // Nothing is left open.
    const size_t fds = std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {});
    const std::pair<const char *, const char *> files[] = {
        {"y1234560tail", "y1234561tail"}, {"y123456", "y1234561"}, {"abcdef", "x0000001"}};
    for (const auto &f : files) {
        root.write(CIT_RESULT_FILE, f.first);
        EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_WCITF"));
        EXPECT_EQ(f.second, root.read(CIT_RESULT_FILE));
    }
    EXPECT_EQ(fds, std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {}));
    // A disk that takes nothing more (a file size limit of 0): no result is stored.
    signal(SIGXFSZ, SIG_IGN);
    struct rlimit old, none;
    ASSERT_EQ(0, getrlimit(RLIMIT_FSIZE, &old));
    none = {0, old.rlim_max};
    ASSERT_EQ(0, setrlimit(RLIMIT_FSIZE, &none));
    const std::string full = ask("AT*CIT_CCITF");
    ASSERT_EQ(0, setrlimit(RLIMIT_FSIZE, &old));
    EXPECT_EQ("\r\nERROR\r\n", full);
    // At most 32 characters of the first line are shown.
    root.write(CIT_RESULT_FILE, std::string(40, '7'));
    EXPECT_EQ("\r\n" + std::string(32, '7') + "\r\nOK\r\n", ask("AT*CIT_GACITF"));
}

// The answer buffer holds 1024 bytes: a long answer is cut so that its final
// result and terminator always fit, and the host always gets a whole final line.
TEST_F(CitForward, LongAnswersAreCutSoTheFinalResultFits) {
    TestApp app(root);
    const struct {
        std::string answer, shown;
        bool ok;
    } cases[] = {
        {pattern("Pass ", 1010), pattern("Pass ", 1010), true},
        {pattern("Pass ", 1011), pattern("Pass ", 1010), true},
        {pattern("Fail ", 1014), pattern("Fail ", 1014), false},
        {pattern("Fail ", 1015), pattern("Fail ", 1014), false},
        {pattern("Fail ", 1024), pattern("Fail ", 1014), false},  // a full receive buffer
        {"Fa|il: no card", "Fail: no card", false},              // judged whole, not on "Fa"
    };
    for (const auto &c : cases) {
        root.write("/app/sn", c.answer);
        EXPECT_EQ(framedVerdict(c.shown, c.ok), ask("AT*CIT_SN")) << c.answer.size() << " bytes answered";
    }
}

// The link kept after an unmatched line is checked before it is used again: after
// the application restarted, the command reaches the new one and is judged on its
// answer, never on the empty answer of the dead link.
TEST_F(CitForward, KeptLinkToARestartedApplicationIsNotReused) {
    auto app = std::make_unique<TestApp>(root);
    EXPECT_EQ("\r\ntest_fail_no_case\r\nERROR\r\n\r\n", ask("AT*CIT_NOSUCH", -1));
    ASSERT_GE(sock_id, 0) << "an unmatched line keeps the link";
    app.reset();  // the application restarts: its link ends, a new one serves
    app = std::make_unique<TestApp>(root);
    root.write("/app/sn", "SN0042");
    EXPECT_EQ(framedVerdict("SN0042", true), ask("AT*CIT_SN"));
}

// Two records. (No store, and one record of the wrong size: cit.tx.)
TEST(ProInfo, UnusableStoreGivesNoFlagAndIsNeverWritten) {
    TestRoot root;
    const std::string twoRecords(2 * PRODUCT_INFO_SIZE, '\x01');
    root.write(kStore, twoRecords);
    EXPECT_EQ(-1, getFlag(FLAG_MMI1_RESULT));
    EXPECT_EQ(-1, setFlag(FLAG_MMI1_RESULT, 0));
    EXPECT_EQ(twoRecords, root.read(kStore));
}

TEST(ProInfo, IndexesOutsideTheRecordAreRefused) {
    TestRoot root;
    const std::string r(PRODUCT_INFO_SIZE, '\x11');
    root.write(kStore, r);
    for (int index : {-1, PRODUCT_INFO_SIZE, PRODUCT_INFO_SIZE + 1, -2147483647 - 1, 2147483647}) {
        EXPECT_EQ(-1, getFlag(index)) << index;
        setFlag(index, 0x22);
    }
    EXPECT_EQ(r, root.read(kStore));
}

// Any process may bind the abstract name first. Only a peer under the uid the
// device build names is the application; anything else is answered for as a
// missing application and hears no word. 2^32 must not wrap onto uid 0.
TEST_F(CitForward, OnlyThePeerUnderTheConfiguredUidIsTheApplication) {
    TestApp app(root);
    root.write("/app/heard", "");
    const std::string me = std::to_string(getuid());
    for (const std::string &value : {std::string("(unset)"), std::string(""), std::to_string(getuid() + 1),
                                     std::string("app"), " " + me, me + "x", std::string("4294967295"),
                                     std::string("4294967296"), std::string("-4294967296")}) {
        if (value == "(unset)") std::remove(root.at(kAppUidProperty).c_str());
        else root.write(kAppUidProperty, value);
        EXPECT_EQ("\r\ntest_fail\r\nERROR\r\n\r\n", ask("AT*CIT_SN", -1)) << "uid property " << value;
        EXPECT_EQ(-1, sock_id);
    }
    EXPECT_EQ("", root.read("/app/heard"));
    root.write(kAppUidProperty, me);
    EXPECT_EQ(framedVerdict("OK", true), ask("AT*CIT_SN"));
    EXPECT_EQ("sn\n", root.read("/app/heard"));
}
