// pxAssert.h - the library's one always-on assertion.
//
// A broken invariant in a real-time scheduler must stop the process even in
// release builds, so this does not depend on NDEBUG.  The expression text is
// taken after macro expansion, so NULL reads as "__null" in the message.
#pragma once

namespace pxalarms {

[[noreturn]] void assertionFailed(const char* expression, const char* file, int line,
                                  const char* function) noexcept;

}  // namespace pxalarms

#define PX_ASSERT_TEXT_(...) #__VA_ARGS__
#define PX_ASSERT_EXPANDED_(...) PX_ASSERT_TEXT_(__VA_ARGS__)

#define PX_ASSERT(...)                                                                       \
    (__builtin_expect(static_cast<bool>(__VA_ARGS__), 1)                                     \
         ? static_cast<void>(0)                                                              \
         : ::pxalarms::assertionFailed(PX_ASSERT_EXPANDED_(__VA_ARGS__), __FILE__, __LINE__, \
                                       __func__))
