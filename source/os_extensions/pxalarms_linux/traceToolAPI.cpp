// traceToolAPI.cpp - trace marker and SetLogMode.
#include "traceToolAPI.h"

#include <fcntl.h>
#include <time.h>
#include <unistd.h>

#include "platformSeams.h"
#include "processObjects.h"
#include "pxAssert.h"
#include "pxalarms.h"

namespace pxalarms {

namespace {
constexpr char kMarkerPath[] = "/sys/kernel/debug/tracing/trace_dr_ptk_marker";
}  // namespace

TraceMarker::~TraceMarker()
{
    close();
}

void TraceMarker::open()
{
    const int fd = ::open(platformPath(kMarkerPath).c_str(), O_WRONLY);
    retire(fd_.exchange(fd, std::memory_order_seq_cst));
}

void TraceMarker::close()
{
    retire(fd_.exchange(-1, std::memory_order_seq_cst));
}

void TraceMarker::writeWord(int fd, uint32_t word)
{
    // Failed or short writes are ignored: tracing must never disturb a loop.
    const ssize_t ignored = ::write(fd, &word, sizeof word);
    (void)ignored;
}

void TraceMarker::retire(int fd)
{
    if (fd < 0)
        return;
    // A writer that read the old descriptor may still be in write(); sleep
    // rather than spin so a preempted lower-priority writer can finish.
    const timespec pause{0, 50000};
    while (writers_.load(std::memory_order_seq_cst) != 0)
        nanosleep(&pause, nullptr);
    ::close(fd);
}

}  // namespace pxalarms

extern "C" void SetLogMode__DRAVICON_pxalarms(int32_t mode)
{
    pxalarms::TraceMarker& marker = *pxalarms::g_traceMarker;
    switch (mode) {
    case 0:
    case -1:
        marker.close();
        break;
    case 2:
        marker.open();
        break;
    default:
        PX_ASSERT(0);
    }
}
