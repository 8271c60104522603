// schedExceptions.cpp - exception texts and the host error writer.
#include "schedExceptions.h"

#include <cstring>

#include "convertLStr.h"

namespace {

constexpr char kAppendMarker[] = "<append>";
constexpr char kTimedStructureLabel[] = "\n\r<b>Timed structure(s):</b> ";
constexpr char kTimingSourceLabel[] = "\n\r<b>Timing source:</b> ";
constexpr char kSyncGroupLabel[] = "\n\r<b>Synchronization group:</b> ";

constexpr int32_t kUnsignedByteType = 5;

std::string nameOrEmpty(const char* name)
{
    return name != nullptr ? std::string(name) : std::string();
}

}  // namespace

CTLSchedException::CTLSchedException(int32_t code_, const char* label, const std::string& name)
    : code(code_)
{
    message.reserve(sizeof kAppendMarker + std::strlen(label) + name.size());
    message.append(kAppendMarker).append(label).append(name);
}

CTLSchedException::~CTLSchedException() = default;

CTimedStructureException::CTimedStructureException(int32_t code, const char* name)
    : CTLSchedException(code, kTimedStructureLabel, nameOrEmpty(name))
{
}

CTimedStructureException::CTimedStructureException(int32_t code, LStr** name)
    : CTLSchedException(code, kTimedStructureLabel, pxalarms::LStrToString(name))
{
}

CTimedStructureException::CTimedStructureException(int32_t code, const std::string& name)
    : CTLSchedException(code, kTimedStructureLabel, name)
{
}

CTimingSourceException::CTimingSourceException(int32_t code, const char* name)
    : CTLSchedException(code, kTimingSourceLabel, nameOrEmpty(name))
{
}

CTimingSourceException::CTimingSourceException(int32_t code, LStr** name)
    : CTLSchedException(code, kTimingSourceLabel, pxalarms::LStrToString(name))
{
}

CSyncGroupException::CSyncGroupException(int32_t code, const char* name)
    : CTLSchedException(code, kSyncGroupLabel, nameOrEmpty(name))
{
}

CSyncGroupException::CSyncGroupException(int32_t code, LStr** name)
    : CTLSchedException(code, kSyncGroupLabel, pxalarms::LStrToString(name))
{
}

CSyncGroupException::CSyncGroupException(int32_t code, const std::string& name)
    : CTLSchedException(code, kSyncGroupLabel, name)
{
}

pxalarms::TicketOutOfRange::TicketOutOfRange() : std::out_of_range("ticket out of range") {}

void SetErrorCluster(ErrorCluster* out, const CTLSchedException& e)
{
    out->status = e.code < 0 ? 1 : 0;
    out->code = e.code;
    // The stored count includes the terminating NUL, as the host expects.
    const size_t n = e.message.size() + 1;
    if (NumericArrayResize(kUnsignedByteType, 1, reinterpret_cast<UHandle*>(&out->source), n) != 0)
        return;
    (*out->source)->cnt = static_cast<int32_t>(n);
    std::memcpy((*out->source)->str, e.message.c_str(), n);
}
