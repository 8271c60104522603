// gencodeCallbacks.h - helpers shared by the functions generated code calls.
#pragma once

#include <cstdint>

#include "pxalarms.h"

namespace pxalarms {

// Only the low 16 bits of a host ticket word count, as a signed short.
inline short ticketFromWord(uint32_t word)
{
    return static_cast<short>(static_cast<uint16_t>(word & 0xFFFFu));
}

inline short ticketOf(const AlarmRef* ref)
{
    return ticketFromWord(static_cast<uint32_t>(ref->ticket));
}

enum class Clock : int32_t;

// Acquires the source registered under `name`, or registers a new clock
// source there.  Throws bad_alloc with nothing registered.
void acquireOrCreateClockSource(const char* name, Clock clock);

}  // namespace pxalarms
