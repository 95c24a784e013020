// A throw-away simulated device root for one test: created fresh, named by
// TOLKD_ROOT while the test runs, removed afterwards.
#ifndef TOLK_TESTS_TEST_ROOT_H
#define TOLK_TESTS_TEST_ROOT_H

#include <string>

class TestRoot {
public:
    TestRoot();
    ~TestRoot();
    TestRoot(const TestRoot &) = delete;
    TestRoot &operator=(const TestRoot &) = delete;

    const std::string &path() const { return path_; }
    // Absolute host path of a device path ("/data/prod/citf" -> <root>/data/prod/citf).
    std::string at(const std::string &devicePath) const;
    // Writes a file under the root, creating its folders.
    void write(const std::string &devicePath, const std::string &content) const;
    // Reads a file under the root; empty when missing.
    std::string read(const std::string &devicePath) const;
    bool exists(const std::string &devicePath) const;

private:
    std::string path_;
    std::string savedRoot_;
    bool hadRoot_ = false;
};

#endif
