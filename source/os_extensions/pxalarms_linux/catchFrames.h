// catchFrames.h - the catch frames of the exported functions.
//
// Every exported function runs its work inside exactly one of these frames,
// so a failure reaches the host in the same form everywhere:
//   errorClusterFrame        - scheduler exception, bad_alloc (2), other (42)
//   errorClusterFrameRequiringReport - the same; a failure with no record
//                              to write it to stops on an assertion
//   ticketErrorClusterFrame  - the same, with an unknown ticket reported as
//                              -804 naming the structure
//   statusFrame              - int32 status: unknown ticket -804, 2, 42
// No exception ever crosses into the host.
#pragma once

#include <cstdint>
#include <new>
#include <utility>

#include "pxAssert.h"
#include "pxalarms.h"
#include "schedExceptions.h"

namespace pxalarms {

// Writes the exception being handled into the record.  Call only from
// inside a catch block.
inline void reportCurrentException(ErrorCluster* error) noexcept
{
    try {
        throw;
    } catch (const CTLSchedException& e) {
        SetErrorCluster(error, e);
    } catch (const std::bad_alloc&) {
        error->status = 1;
        error->code = kOutOfMemory;
    } catch (...) {
        error->status = 1;
        error->code = kOtherFailure;
    }
}

// A null error record reports nothing; callers that require one assert first.
template <class Work>
void errorClusterFrame(ErrorCluster* error, Work&& work) noexcept
{
    try {
        std::forward<Work>(work)();
    } catch (...) {
        if (error != nullptr)
            reportCurrentException(error);
    }
}

// For functions whose record may be null until there is a failure to
// report; the assertion names the exported function.
template <class Work>
void errorClusterFrameRequiringReport(ErrorCluster* error, const char* expression,
                                      const char* function, Work&& work) noexcept
{
    try {
        std::forward<Work>(work)();
    } catch (...) {
        if (error == nullptr)
            assertionFailed(expression, __FILE__, __LINE__, function);
        reportCurrentException(error);
    }
}

template <class Work>
void errorClusterFrameRequiringReport(ErrorCluster* error, const char* function,
                                      Work&& work) noexcept
{
    errorClusterFrameRequiringReport(error, "(error) != __null", function,
                                     std::forward<Work>(work));
}

// makeUnknown() builds the CTimedStructureException(-804, ...) thrown in place
// of a TicketOutOfRange; building it may itself fail with bad_alloc, which the
// outer handlers of the same frame then report.
template <class Work, class MakeUnknown>
void ticketErrorClusterFrame(ErrorCluster* error, MakeUnknown&& makeUnknown, Work&& work) noexcept
{
    errorClusterFrame(error, [&] {
        try {
            std::forward<Work>(work)();
        } catch (const TicketOutOfRange&) {
            throw std::forward<MakeUnknown>(makeUnknown)();
        }
    });
}

template <class Work>
void statusFrame(int32_t* status, Work&& work) noexcept
{
    try {
        std::forward<Work>(work)();
    } catch (const TicketOutOfRange&) {
        *status = kNoSuchStructure;
    } catch (const std::bad_alloc&) {
        *status = kOutOfMemory;
    } catch (...) {
        *status = kOtherFailure;
    }
}

}  // namespace pxalarms
