// How the functions get at a path, and what they do if they do not.

#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <future>
#include <string>

#include <marubackup/maru_archive_version.h>
#include <marucore/error.h>

#include "archive_test.h"
#include "support/files.h"
#include "support/gate.h"
#include "support/in_child.h"
#include "support/nobody.h"

namespace {

const int BAD_PARAMETER = 0x0D00;
const int NOT_OPENED = 0x0900;

const Function OPENING[] = {MARUBackupFSArchVerGet, MARUBackupFSArchVerIncrease, setFileVersion};

class Opening : public ArchiveTest {
protected:
    void expectNotOpened(int error, const std::string& path) {
        SCOPED_TRACE(path);
        for (const Function function : OPENING) {
            const Answer answer = ask(function, path);
            EXPECT_EQ(-1, answer.result);
            EXPECT_EQ(UNTOUCHED, answer.version);
            EXPECT_EQ(error, answer.error);
            expectError(NOT_OPENED);
        }
    }
};

} // namespace

TEST_F(Opening, ANullPathIsLoggedByTheFunctionsForFiles) {
    unsigned version = UNTOUCHED;
    EXPECT_EQ(-1, MARUBackupArchVerGet(nullptr, &version));
    expectError(BAD_PARAMETER);
    expectLogged("Input bad parameter\\.");

    EXPECT_EQ(-1, MARUBackupFileArchVerSet(nullptr, version));
    expectError(BAD_PARAMETER);
    expectLogged("Input bad parameter\\.");
    EXPECT_EQ(UNTOUCHED, version);
}

TEST_F(Opening, ANullPathIsNotLoggedByTheFunctionsForFileSystems) {
    unsigned version = UNTOUCHED;
    EXPECT_EQ(-1, MARUBackupFSArchVerGet(nullptr, &version));
    expectError(BAD_PARAMETER);

    EXPECT_EQ(-1, MARUBackupFSArchVerIncrease(nullptr, &version));
    expectError(BAD_PARAMETER);
    EXPECT_EQ(UNTOUCHED, version);
}

TEST_F(Opening, APathThatCannotBeOpenedIsAnErrorThatNobodyLogs) {
    support::writeFile(folder.path("file"), "data");
    ASSERT_EQ(0, symlink("nowhere", folder.path("dangling").c_str()));
    ASSERT_EQ(0, symlink("circle", folder.path("circle").c_str()));

    expectNotOpened(ENOENT, folder.path("missing"));
    expectNotOpened(ENOENT, folder.path("missing/file"));
    expectNotOpened(ENOENT, folder.path("dangling"));
    expectNotOpened(ENOENT, "");
    expectNotOpened(ENOTDIR, folder.path("file/below"));
    expectNotOpened(ELOOP, folder.path("circle"));
    expectNotOpened(ENAMETOOLONG, std::string(5000, 'x'));
}

TEST_F(Opening, AFileThatMayNotBeReadIsAnErrorThatNobodyLogs) {
    support::writeFile(folder.path("file"), "data", 0600);
    const int status = support::runInChild([this]() {
        support::becomeNobody();
        expectNotOpened(EACCES, folder.path("file"));
        return HasFailure() ? 1 : 0;
    });
    EXPECT_EQ("exit 0", support::describeStatus(status));
}

TEST_F(Opening, AFileSystemWithoutVersionsIsItsOwnAnswerAndNoError) {
    support::writeFile(folder.path("file"), "data");
    for (const std::string& path : {folder.path(), folder.path("file"), std::string("/proc/self/status")}) {
        for (const Function function : {MARUBackupFSArchVerGet, MARUBackupFSArchVerIncrease}) {
            SCOPED_TRACE(path);
            const Answer answer = ask(function, path);
            EXPECT_EQ(-1, answer.result);
            EXPECT_EQ(0U, answer.version);
            EXPECT_EQ(ENOTTY, answer.error);
            expectNoError();
        }
    }
}

TEST_F(Opening, SettingAFilesVersionIsRefusedAndChangesNothing) {
    support::writeFile(folder.path("file"), "data");
    ASSERT_EQ(0, symlink("file", folder.path("link").c_str()));
    for (const std::string& path : {folder.path("file"), folder.path(), folder.path("link")}) {
        EXPECT_EQ(-1, MARUBackupFileArchVerSet(path.c_str(), 7));
        expectLogged("Not support the command in the platform\\.");
        expectNoError();
    }
    EXPECT_EQ("data", support::readFile(folder.path("file")));
    unsigned version = UNTOUCHED;
    EXPECT_EQ(0, MARUBackupArchVerGet(folder.path("file").c_str(), &version));
    EXPECT_EQ(0U, version);
}

TEST_F(Opening, WaitsAtAFifoForItsWriter) {
    int number = 0;
    for (const Function function : OPENING) {
        support::Gate gate(folder.path("fifo" + std::to_string(++number)));
        std::future<Answer> call = std::async(std::launch::async, ask, function, gate.path());
        gate.awaitJob(); // nobody can open it for writing before somebody waits
        EXPECT_EQ(-1, call.get().result);
    }
    expectLogged("Not support the command in the platform\\.");
}

TEST_F(Opening, ASignalEndsTheWaitAtAFifo) {
    ASSERT_EQ(0, mkfifo(folder.path("fifo").c_str(), 0600));
    const int status = support::runInChild([this]() {
        struct sigaction action = {};
        action.sa_handler = [](int) {};
        sigaction(SIGALRM, &action, nullptr);
        // Again and again: one that comes before the wait does not end it.
        const itimerval often = {{0, 20000}, {0, 20000}};
        setitimer(ITIMER_REAL, &often, nullptr);
        expectNotOpened(EINTR, folder.path("fifo"));
        return HasFailure() ? 1 : 0;
    });
    EXPECT_EQ("exit 0", support::describeStatus(status));
}

TEST_F(Opening, AnotherThreadsErrorIsNotOurs) {
    std::async(std::launch::async, [this]() { expectNotOpened(ENOENT, folder.path("missing")); }).get();
    ask(MARUBackupFSArchVerGet, folder.path("missing"));
    std::async(std::launch::async, []() { EXPECT_EQ(MLIBC_ERR_NONE, MLIBCErrGet()); }).get();
    expectError(NOT_OPENED);
}
