#include <dlfcn.h>
#include <gtest/gtest.h>

#include "hostSubstitute.h"
#include "pxalarms.h"

TEST(SharedLibrary, LoadsAndReportsThroughTheHost)
{
    void* lib = dlopen(PXALARMS_LIBRARY_PATH, RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(lib, nullptr) << dlerror();
    dlclose(lib);
}
