#include <gtest/gtest.h>

#include "testSupport.h"

TEST(AlarmTable, FirstTicketsCountUpFromZero)
{
    testsupport::HostError error;
    AlarmRef refs[3]{};
    for (auto& ref : refs)
        AlarmNew__DRAVICON_pxalarms("loop", 0, &ref, error.get());
    EXPECT_EQ(refs[0].ticket, 0);
    EXPECT_EQ(refs[1].ticket, 1);
    EXPECT_EQ(refs[2].ticket, 2);
    for (auto& ref : refs)
        AlarmDeleteRef__DRAVICON_pxalarms(&ref, error.get());
    EXPECT_EQ(error.cluster.status, 0);
}
