#include "archive_test.h"

#include <syslog.h>
#include <unistd.h>

#include <cerrno>

#include <gmock/gmock.h>

#include <marubackup/maru_archive_version.h>
#include <marucore/error.h>

#include "support/waiting.h"

Answer ask(Function function, const std::string& path) {
    unsigned version = UNTOUCHED;
    errno = 0;
    const int result = function(path.c_str(), &version);
    return {result, version, errno};
}

int setFileVersion(const char* path, unsigned int* version) {
    return MARUBackupFileArchVerSet(path, *version);
}

void ArchiveTest::SetUp() {
    openlog(nullptr, LOG_NDELAY, LOG_USER); // a descriptor that is not counted
    MLIBCErrSetEx(MLIBC_ERR_NONE, nullptr, 0);
    descriptors = support::openDescriptors(getpid());
}

void ArchiveTest::TearDown() {
    EXPECT_EQ(descriptors, support::openDescriptors(getpid()));
    const std::vector<support::SyslogLine> lines = log.lines();
    ASSERT_EQ(logged.size(), lines.size());
    for (std::size_t at = 0; at < lines.size(); ++at) {
        EXPECT_EQ(LOG_ERR, lines[at].priority);
        EXPECT_THAT(lines[at].message, testing::MatchesRegex("maru_archive_version:[1-9][0-9]* " + logged[at]));
    }
}

void ArchiveTest::expectLogged(const std::string& text) {
    logged.push_back(text);
}

void ArchiveTest::expectError(int code) {
    EXPECT_EQ(code, MLIBCErrGet());
    EXPECT_STREQ("maru_archive_version.c", MLIBCErrorGetFile());
    EXPECT_GT(MLIBCErrorGetLine(), 0);
    MLIBCErrSetEx(MLIBC_ERR_NONE, nullptr, 0);
}

void ArchiveTest::expectNoError() {
    EXPECT_EQ(MLIBC_ERR_NONE, MLIBCErrGet());
}
