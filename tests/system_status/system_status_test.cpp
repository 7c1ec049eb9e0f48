#include <marubackup/system_status.h>

#include <gtest/gtest.h>

using MARU::Backup::System;

TEST(SystemStatus, KnowsOfNoRestoreOutsideTheQueue) {
    EXPECT_FALSE(System::isRestoreRunningNotQueued(""));
    EXPECT_FALSE(System::isRestoreRunningNotQueued("tidebackup"));
    EXPECT_FALSE(System::isRestoreRunningNotQueued("configbackup"));
}
