// pxAssert.cpp - reporting of a failed assertion.
#include "pxAssert.h"

#include <cstdio>
#include <cstdlib>

namespace pxalarms {

void assertionFailed(const char* expression, const char* file, int line,
                     const char* function) noexcept
{
    std::fprintf(stderr, "libpxalarms: %s:%d: %s: Assertion `%s' failed.\n", file, line, function,
                 expression);
    std::fflush(stderr);
    std::abort();
}

}  // namespace pxalarms
