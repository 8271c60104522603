// testSupport.h - shared fixtures for the library's tests.
//
//   HostError        an ErrorCluster whose text handle is freed at scope end
//   TempTree         a temporary directory standing in for "/" (proc, sys...)
//   ReloadedLibrary  unloads the process-wide objects and loads them again
//                    under a root prefix, as a fresh load of the library would
//   LogCapture       collects what the library sends to syslog
#pragma once

#include <mutex>
#include <string>
#include <vector>

#include "pxalarms.h"

namespace testsupport {

struct HostError {
    ErrorCluster cluster{0, 0, nullptr};
    HostError() = default;
    HostError(const HostError&) = delete;
    HostError& operator=(const HostError&) = delete;
    ~HostError();
    ErrorCluster* get() { return &cluster; }
    std::string text() const;  // counted bytes of source, including the NUL
};

class TempTree {
public:
    TempTree();
    ~TempTree();
    TempTree(const TempTree&) = delete;
    TempTree& operator=(const TempTree&) = delete;

    const std::string& root() const { return root_; }
    std::string path(const std::string& absolute) const { return root_ + absolute; }
    // Writes a file at an absolute path under the root, creating directories.
    void write(const std::string& absolute, const std::string& content) const;
    std::string read(const std::string& absolute) const;

private:
    std::string root_;
};

class ReloadedLibrary {
public:
    explicit ReloadedLibrary(const std::string& rootPrefix);
    ~ReloadedLibrary();
    ReloadedLibrary(const ReloadedLibrary&) = delete;
    ReloadedLibrary& operator=(const ReloadedLibrary&) = delete;
};

class LogCapture {
public:
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    struct Line {
        int priority;
        std::string text;
    };
    std::vector<Line> lines() const;

private:
    static void sink(int priority, const char* text);
};

}  // namespace testsupport
