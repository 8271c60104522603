/*
 * pxalarms.h - the exported C interface of libpxalarms.so.6.
 *
 * Declares the host records that cross the call boundary (ErrorCluster,
 * LStr, AlarmRef, TSrcRef), the host runtime functions the library imports, and
 * every function the library exports.  The byte layout of the records is
 * fixed by the host; the static_asserts below pin it for the 32-bit ARM
 * product build.  On the LP64 development build pointers are 8 bytes, so
 * ErrorCluster.source sits at offset 8 and the record is 16 bytes long.
 */
#ifndef PXALARMS_H
#define PXALARMS_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define PXALARMS_EXPORT __attribute__((visibility("default")))

typedef uint8_t PXBoolean;

/* Host string: a count followed by that many bytes, no terminator. */
typedef struct {
    int32_t cnt;
    uint8_t str[1];
} LStr;

/* Host error record. */
typedef struct {
    PXBoolean status; /* nonzero: the record reports an error */
    int32_t code;     /* status code; negative is an error */
    LStr** source;    /* text of the report, resized by the library */
} ErrorCluster;

/* The host's reference to a timed structure; the library owns word 2. */
typedef struct {
    uint32_t hostWord0;
    uint32_t hostWord1;
    int32_t ticket; /* low 16 bits: the signed ticket */
} AlarmRef;

/* The host's timing-source reference; only abortUsers is read. */
typedef struct {
    uint32_t hostWord0;
    uint16_t hostWord1;
    int32_t abortUsers; /* delete: nonzero aborts structures still using it */
} TSrcRef;

typedef void** UHandle;

/* Host runtime functions, resolved from the host process at load. */
int32_t NumericArrayResize(int32_t typeCode, int32_t numDims, UHandle* handle, size_t numElems);
UHandle DSNewHandle(size_t size);
int32_t DSSetHandleSize(UHandle handle, size_t size);
int32_t RTSetCleanupProc(int32_t (*proc)(void*), void* context, int32_t mode);

/* Alarm table. */
PXALARMS_EXPORT void AlarmNew__DRAVICON_pxalarms(const char* name, int32_t unused, AlarmRef* ref,
                                                 ErrorCluster* error);
PXALARMS_EXPORT void AlarmDeleteRef__DRAVICON_pxalarms(AlarmRef* ref, ErrorCluster* error);

/* Named clock timing sources. */
PXALARMS_EXPORT void TSrcNewTickTimer__DRAVICON_pxalarms(const char* name, TSrcRef* ref,
                                                         ErrorCluster* error);
PXALARMS_EXPORT void TSrcNewTSC__DRAVICON_pxalarms(const char* name, TSrcRef* ref,
                                                   ErrorCluster* error);
PXALARMS_EXPORT void TSrcNewTickTimerPX__DRAVICON_pxalarms(char* name, TSrcRef* ref,
                                                           int32_t cleanupFlag,
                                                           ErrorCluster* error);
PXALARMS_EXPORT void TSrcNewTSCPX__DRAVICON_pxalarms(char* name, TSrcRef* ref, int32_t cleanupFlag,
                                                     ErrorCluster* error);
PXALARMS_EXPORT void TSrcDeleteName__DRAVICON_pxalarms(const char* name, TSrcRef* ref,
                                                       ErrorCluster* error);

/* High-resolution waits on CLOCK_MONOTONIC. */
PXALARMS_EXPORT int32_t SupportsTSC__DRAVICON_pxalarms(void);
PXALARMS_EXPORT int64_t iTSC_WaitUntilNextMultipleMicroSeconds_C(uint32_t intervalUs);
PXALARMS_EXPORT int64_t iTSC_WaitUntilNextMultipleClocks_C(uint32_t intervalNs);
PXALARMS_EXPORT int64_t iTSC_WaitMicroSeconds_C(uint32_t durationUs);
PXALARMS_EXPORT int64_t iTSC_WaitClocks_C(uint32_t durationNs);

/* Synchronization groups: structures that start together.  Group names
 * are host strings (a null handle is the empty name). */
PXALARMS_EXPORT void AlarmAddToGroup__DRAVICON_pxalarms(const char* alarmName, LStr** groupName,
                                                        int32_t timeoutMs, PXBoolean* allowMove,
                                                        ErrorCluster* error);
PXALARMS_EXPORT void GetGroupMember__DRAVICON_pxalarms(LStr** groupName, int32_t* alarmIndex,
                                                       LStr*** alarmNameOut,
                                                       ErrorCluster* errorOut);
PXALARMS_EXPORT void ResetGroup__DRAVICON_pxalarms(LStr** groupName, ErrorCluster* errorOut);
PXALARMS_EXPORT void AbortGroup__DRAVICON_pxalarms(LStr** groupName, PXBoolean* unused,
                                                   ErrorCluster* errorOut);

/* CPU pools: pool 0x12345402 is the system set, 0x12345403 the timed-loop
 * set; bit k of mask allows processor k. */
PXALARMS_EXPORT void SetPoolAffinityMask__DRAVICON_pxalarms(uint32_t pool, uint32_t mask);

/* Tracing: 0 or -1 switch off, 2 switches on. */
PXALARMS_EXPORT void SetLogMode__DRAVICON_pxalarms(int32_t mode);

#ifdef __cplusplus
}
#endif

#if defined(__cplusplus)
#define PXALARMS_STATIC_ASSERT static_assert
#else
#define PXALARMS_STATIC_ASSERT _Static_assert
#endif

PXALARMS_STATIC_ASSERT(offsetof(ErrorCluster, status) == 0, "ErrorCluster.status");
PXALARMS_STATIC_ASSERT(offsetof(ErrorCluster, code) == 4, "ErrorCluster.code");
PXALARMS_STATIC_ASSERT(offsetof(ErrorCluster, source) == 8, "ErrorCluster.source");
PXALARMS_STATIC_ASSERT(offsetof(LStr, str) == 4, "LStr.str");
PXALARMS_STATIC_ASSERT(offsetof(AlarmRef, ticket) == 8, "AlarmRef.ticket");
PXALARMS_STATIC_ASSERT(sizeof(AlarmRef) == 12, "AlarmRef size");
PXALARMS_STATIC_ASSERT(sizeof(ErrorCluster) == 8 + sizeof(void*), "ErrorCluster size");
PXALARMS_STATIC_ASSERT(offsetof(TSrcRef, hostWord1) == 4, "TSrcRef.hostWord1");
PXALARMS_STATIC_ASSERT(offsetof(TSrcRef, abortUsers) == 8, "TSrcRef.abortUsers");
PXALARMS_STATIC_ASSERT(sizeof(TSrcRef) == 12, "TSrcRef size");
#if defined(__arm__)
PXALARMS_STATIC_ASSERT(sizeof(void*) == 4 && sizeof(ErrorCluster) == 12, "32-bit ARM layout");
#endif

#endif /* PXALARMS_H */
