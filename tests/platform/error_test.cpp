#include <marucore/error.h>

#include <string>
#include <thread>

#include <gtest/gtest.h>

namespace {

void expectSlot(int code, const std::string& file, int line) {
    EXPECT_EQ(code, MLIBCErrGet());
    EXPECT_EQ(file, MLIBCErrorGetFile());
    EXPECT_EQ(line, MLIBCErrorGetLine());
}

} // namespace

TEST(TheErrorSlot, IsEmptyAtFirst) {
    std::thread([] { expectSlot(MLIBC_ERR_NONE, "", 0); }).join();
}

TEST(TheErrorSlot, HoldsTheLastFailure) {
    MLIBCErrSetEx(MLIBC_ERR_OPEN, "first.c", 1);
    MLIBCErrSetEx(MLIBC_ERR_BAD_PARAMETER, "second.c", 22);

    expectSlot(0x0D00, "second.c", 22);
}

TEST(TheErrorSlot, IsEachThreadsOwn) {
    MLIBCErrSetEx(1, "ours.c", 10);

    std::thread([] {
        MLIBCErrSetEx(2, "theirs.c", 20);
        expectSlot(2, "theirs.c", 20);
    }).join();

    expectSlot(1, "ours.c", 10);
}

TEST(TheErrorSlot, KeepsACopyOfTheFilesName) {
    std::string name = "name.c";
    MLIBCErrSetEx(1, name.c_str(), 1);
    name.assign("other!");

    expectSlot(1, "name.c", 1);
}

TEST(TheErrorSlot, TakesAnyNameOfAFile) {
    MLIBCErrSetEx(1, nullptr, 2);
    expectSlot(1, "", 2);

    MLIBCErrSetEx(1, std::string(255, 'x').c_str(), 2);
    expectSlot(1, std::string(255, 'x'), 2);

    MLIBCErrSetEx(1, std::string(100000, 'y').c_str(), 2);
    expectSlot(1, std::string(255, 'y'), 2);

    MLIBCErrSetEx(3, MLIBCErrorGetFile() + 250, 4);
    expectSlot(3, "yyyyy", 4);
}
