#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "support/syslog_socket.h"
#include "support/temp_dir.h"

/** One of the functions that give a version. */
using Function = int (*)(const char* path, unsigned int* version);

/** What a function's version is before the call. */
const unsigned UNTOUCHED = 4711;

/** What a call came to; `error` is errno. */
struct Answer {
    int result;
    unsigned version;
    int error;
};

/** A call with an untouched version. */
Answer ask(Function function, const std::string& path);

/** MARUBackupFileArchVerSet() in the form of the others. */
int setFileVersion(const char* path, unsigned int* version);

/**
 * A test of the archive functions. At its end there are as many descriptors open
 * as at its start, and nothing is in the log but what it expects there.
 */
class ArchiveTest : public testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;

    /** One more line that the functions have to log: "maru_archive_version:LINE text", at LOG_ERR. */
    void expectLogged(const std::string& text);
    /** The error slot holds `code`, from the functions' own source; it is empty again. */
    static void expectError(int code);
    static void expectNoError();

    support::TempDir folder;
    support::SyslogSocket log;

private:
    std::vector<std::string> logged;
    int descriptors = 0;
};
