#include "test_root.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

namespace fs = std::filesystem;

TestRoot::TestRoot() {
    const char *old = std::getenv("TOLKD_ROOT");
    if (old != nullptr) {
        hadRoot_ = true;
        savedRoot_ = old;
    }
    std::string tmpl = (fs::temp_directory_path() / "tolk-test-XXXXXX").string();
    if (mkdtemp(tmpl.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
    path_ = tmpl;
    setenv("TOLKD_ROOT", path_.c_str(), 1);
}

TestRoot::~TestRoot() {
    if (hadRoot_) setenv("TOLKD_ROOT", savedRoot_.c_str(), 1);
    else unsetenv("TOLKD_ROOT");
    std::error_code ec;
    fs::remove_all(path_, ec);
}

std::string TestRoot::at(const std::string &devicePath) const { return path_ + devicePath; }

void TestRoot::write(const std::string &devicePath, const std::string &content) const {
    fs::path p = at(devicePath);
    fs::create_directories(p.parent_path());
    std::ofstream out(p, std::ios::binary | std::ios::trunc);
    out << content;
}

std::string TestRoot::read(const std::string &devicePath) const {
    std::ifstream in(at(devicePath), std::ios::binary);
    std::ostringstream s;
    s << in.rdbuf();
    return s.str();
}

bool TestRoot::exists(const std::string &devicePath) const { return fs::exists(at(devicePath)); }
