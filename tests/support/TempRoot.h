// A private USBADAPTER_ROOT for one test: the controller's fixed directories
// under a temporary folder, removed again with everything in it.
#pragma once

#include <cstdlib>
#include <filesystem>
#include <string>

class TempRoot {
public:
    TempRoot() {
        char tmpl[] = "/tmp/usbadapter-test-XXXXXX";
        const char *dir = ::mkdtemp(tmpl);
        if (dir) path_ = dir;
        std::filesystem::create_directories(path_ + "/halvard/sys/statusinfo");
        std::filesystem::create_directories(path_ + "/halvard/spool/tmp");
        ::setenv("USBADAPTER_ROOT", path_.c_str(), 1);
    }
    ~TempRoot() {
        ::unsetenv("USBADAPTER_ROOT");
        std::error_code ec;
        std::filesystem::remove_all(path_, ec);
    }
    TempRoot(const TempRoot &) = delete;
    TempRoot &operator=(const TempRoot &) = delete;

    const std::string &path() const { return path_; }
    // Path of a controller file inside this root ("/halvard/..." → "<root>/halvard/...").
    std::string operator/(const std::string &absolute) const { return path_ + absolute; }

private:
    std::string path_;
};
