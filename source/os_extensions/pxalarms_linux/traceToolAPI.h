// traceToolAPI.h - the kernel trace marker and the exported log mode switch.
//
// g_traceMarker holds the descriptor of the marker file while tracing is on.
// Timed loops write 4-byte events from their period waits while a host thread
// may switch tracing off; a writer announces itself in writers_ before it
// reads fd_, and close() waits for writers to leave before it closes, so an
// event never lands in a file that reused the closed descriptor number.
#pragma once

#include <atomic>
#include <cstdint>

namespace pxalarms {

enum class TraceEvent : uint32_t {
    kWaitStart = 0x20,
    kFinishedLate = 0x30,
};

class TraceMarker {
public:
    TraceMarker() = default;
    ~TraceMarker();
    TraceMarker(const TraceMarker&) = delete;
    TraceMarker& operator=(const TraceMarker&) = delete;

    // Opens the marker, closing an earlier descriptor first; a failed open
    // leaves tracing off.
    void open();
    void close();
    bool isOn() const { return fd_.load(std::memory_order_relaxed) >= 0; }

    // Hot path: one load when off; one 4-byte write when on.
    void writeEvent(uint32_t eventCode)
    {
        if (fd_.load(std::memory_order_relaxed) < 0)
            return;  // tracing off: no read-modify-write on the loop's path
        writers_.fetch_add(1, std::memory_order_seq_cst);
        const int fd = fd_.load(std::memory_order_seq_cst);
        if (fd >= 0)
            writeWord(fd, 0x300u | eventCode);
        writers_.fetch_sub(1, std::memory_order_release);
    }
    void writeEvent(TraceEvent event) { writeEvent(static_cast<uint32_t>(event)); }

private:
    static void writeWord(int fd, uint32_t word);
    void retire(int fd);

    std::atomic<int32_t> fd_{-1};
    std::atomic<uint32_t> writers_{0};
};

}  // namespace pxalarms
