// schedExceptions.h - the scheduler's exceptions and the host error writer.
//
// Failures travel inside the library as exceptions; the exported layer turns
// them into ErrorCluster records with SetErrorCluster (see catchFrames.h).
// CTLSchedException carries a status code and the composed text:
// "<append>", the class's label, then the name of the object concerned.
#pragma once

#include <cstdint>
#include <exception>
#include <stdexcept>
#include <string>

#include "pxalarms.h"

class CTLSchedException : public std::exception {
public:
    ~CTLSchedException() override;

    int32_t code;
    std::string message;

protected:
    CTLSchedException(int32_t code, const char* label, const std::string& name);
};

class CTimedStructureException : public CTLSchedException {
public:
    CTimedStructureException(int32_t code, const char* name);
    CTimedStructureException(int32_t code, LStr** name);
    // Names that may hold any byte, a NUL included (group names).
    CTimedStructureException(int32_t code, const std::string& name);
};

class CTimingSourceException : public CTLSchedException {
public:
    CTimingSourceException(int32_t code, const char* name);
    CTimingSourceException(int32_t code, LStr** name);
};

class CSyncGroupException : public CTLSchedException {
public:
    CSyncGroupException(int32_t code, const char* name);
    CSyncGroupException(int32_t code, LStr** name);
    CSyncGroupException(int32_t code, const std::string& name);
};

namespace pxalarms {

// Thrown by the alarm table for a ticket outside the table or not sold.
class TicketOutOfRange : public std::out_of_range {
public:
    TicketOutOfRange();
};

// Status codes reported to the host.
enum StatusCode : int32_t {
    kTableFull = -800,
    kNoSuchStructure = -804,
    kNoSuchTimingSource = -805,
    kNoSuchGroup = -806,
    kTriggerExists = -809,
    kGroupAborted = -810,
    kInOtherGroup = -812,
    kGroupStarting = -814,
    kStructureAborted = -816,
    kTimingSourceFailed = -817,
    kBadPriority = -818,
    kParameterNotSet = -820,
    kGroupStartTimedOut = -821,
    kProcessorFailed = -825,
    kBadTriggerIndex = -830,
    kBadTriggerCount = -831,
    kPriorityFailed = -832,
    kOutOfMemory = 2,
    kOtherFailure = 42,
};

}  // namespace pxalarms

// Writes the exception into the host record: status, code, and the text
// resized into the record's source handle.  A failed resize leaves status
// and code written and the handle as it was.
void SetErrorCluster(ErrorCluster* out, const CTLSchedException& e);
