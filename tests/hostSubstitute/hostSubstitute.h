// hostSubstitute.h - stand-in for the host runtime's memory manager and
// cleanup registry, for tests and tools that run the library without a host.
//
// Handles are real heap blocks (a malloc'd master pointer to a malloc'd
// block), so a leaked or doubly freed handle shows up under AddressSanitizer.
// Any host call can be made to fail for its next N calls, and the registered
// cleanup procedures can be run as the host runs them at program end.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "pxalarms.h"

namespace hostsub {

enum class HostCall { kNumericArrayResize, kDSNewHandle, kDSSetHandleSize, kRTSetCleanupProc };

// The next `count` calls of `call` fail (nonzero result or null handle).
void failNext(HostCall call, int count);
// Number of calls of `call` since the last reset().
int callCount(HostCall call);

// Frees a handle made by the substitute; null is ignored.
void disposeHandle(UHandle handle);
template <class T>
void disposeHandle(T** handle)
{
    disposeHandle(reinterpret_cast<UHandle>(handle));
}

// Bytes usable in the block of a handle (as last sized).
size_t handleSize(UHandle handle);

// Runs every registered cleanup procedure once, oldest first, and forgets
// them; returns how many ran.
int runCleanupProcs();
int pendingCleanupProcs();

// Clears fault injection and counters (pending cleanups are kept).
void reset();

// Convenience: the text of an LStr handle as bytes (count bytes).
std::string text(LStr** handle);

}  // namespace hostsub
