// testSupport.cpp - shared test fixtures.
#include "testSupport.h"

#include <ftw.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include "hostSubstitute.h"
#include "platformSeams.h"
#include "processObjects.h"

namespace testsupport {

HostError::~HostError()
{
    hostsub::disposeHandle(cluster.source);
}

std::string HostError::text() const
{
    return hostsub::text(cluster.source);
}

TempTree::TempTree()
{
    char pattern[] = "/tmp/pxalarms-test-XXXXXX";
    if (mkdtemp(pattern) == nullptr)
        throw std::runtime_error("mkdtemp failed");
    root_ = pattern;
}

TempTree::~TempTree()
{
    nftw(
        root_.c_str(),
        [](const char* p, const struct stat*, int, struct FTW*) { return ::remove(p); }, 16,
        FTW_DEPTH | FTW_PHYS);
}

void TempTree::write(const std::string& absolute, const std::string& content) const
{
    const std::string full = path(absolute);
    for (size_t slash = full.find('/', root_.size() + 1); slash != std::string::npos;
         slash = full.find('/', slash + 1))
        mkdir(full.substr(0, slash).c_str(), 0755);
    std::ofstream out(full, std::ios::binary | std::ios::trunc);
    out << content;
}

std::string TempTree::read(const std::string& absolute) const
{
    std::ifstream in(path(absolute), std::ios::binary);
    std::ostringstream content;
    content << in.rdbuf();
    return content.str();
}

ReloadedLibrary::ReloadedLibrary(const std::string& rootPrefix)
{
    pxalarms::unloadProcessObjects();
    pxalarms::testing::setRootPrefix(rootPrefix);
    pxalarms::loadProcessObjects();
}

ReloadedLibrary::~ReloadedLibrary()
{
    pxalarms::unloadProcessObjects();
    pxalarms::testing::setRootPrefix("");
    pxalarms::loadProcessObjects();
}

namespace {
std::mutex captureMutex;
std::vector<LogCapture::Line> captured;
}  // namespace

LogCapture::LogCapture()
{
    std::lock_guard<std::mutex> lock(captureMutex);
    captured.clear();
    pxalarms::testing::setLogSink(&LogCapture::sink);
}

LogCapture::~LogCapture()
{
    pxalarms::testing::setLogSink(nullptr);
}

std::vector<LogCapture::Line> LogCapture::lines() const
{
    std::lock_guard<std::mutex> lock(captureMutex);
    return captured;
}

void LogCapture::sink(int priority, const char* text)
{
    std::lock_guard<std::mutex> lock(captureMutex);
    captured.push_back({priority, text});
}

}  // namespace testsupport
