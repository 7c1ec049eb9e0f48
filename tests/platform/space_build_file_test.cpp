#include <marustorage/space_build_file.h>

#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "support/appliance.h"
#include "support/in_child.h"
#include "support/nobody.h"

using support::SPACE_BUILD_FILE;
using support::writeFile;

namespace {

enum class Answer { NONE, BUILDING, UNKNOWN, CONTRADICTION };

Answer ask() {
    int elsewhere = 0;
    auto* record = reinterpret_cast<MARUSpaceBuildFile*>(&elsewhere);
    const int result = MARUSpaceBuildFileGet(&record);
    const bool building = record != nullptr;
    MARUSpaceBuildFileObjFree(record);
    if (result < 0) {
        return building ? Answer::CONTRADICTION : Answer::UNKNOWN;
    }
    return building ? Answer::BUILDING : Answer::NONE;
}

class SpaceBuild : public testing::Test {
protected:
    SpaceBuild() {
        support::emptyAppliance();
    }
    ~SpaceBuild() override {
        support::emptyAppliance();
    }
};

} // namespace

TEST_F(SpaceBuild, GoesOnAsLongAsItsFileExists) {
    EXPECT_EQ(Answer::NONE, ask());
    writeFile(SPACE_BUILD_FILE, "volume1\n");
    EXPECT_EQ(Answer::BUILDING, ask());
    EXPECT_EQ(Answer::BUILDING, ask());
    unlink(SPACE_BUILD_FILE);
    EXPECT_EQ(Answer::NONE, ask());
}

TEST_F(SpaceBuild, DoesNotDependOnWhatTheFileHolds) {
    for (const std::string& text : {std::string(), std::string("\0", 1), std::string(1 << 20, 'x')}) {
        writeFile(SPACE_BUILD_FILE, text);
        EXPECT_EQ(Answer::BUILDING, ask());
    }
}

TEST_F(SpaceBuild, IsNotToldBySomethingThatIsNoFile) {
    ASSERT_EQ(0, mkdir(SPACE_BUILD_FILE, 0755));
    EXPECT_EQ(Answer::UNKNOWN, ask());
    ASSERT_EQ(0, rmdir(SPACE_BUILD_FILE));

    ASSERT_EQ(0, mkfifo(SPACE_BUILD_FILE, 0644));
    EXPECT_EQ(Answer::UNKNOWN, ask()); // and nobody waits for a writer
    ASSERT_EQ(0, unlink(SPACE_BUILD_FILE));

    ASSERT_EQ(0, symlink(SPACE_BUILD_FILE, SPACE_BUILD_FILE));
    EXPECT_EQ(Answer::UNKNOWN, ask());
}

TEST_F(SpaceBuild, IsNotToldToWhomTheFileIsClosed) {
    writeFile(SPACE_BUILD_FILE, "", 0600);
    const int status = support::runInChild([] {
        support::becomeNobody();
        return ask() == Answer::UNKNOWN ? 0 : 1;
    });
    EXPECT_EQ("exit 0", support::describeStatus(status));
}

TEST_F(SpaceBuild, NeedsAPlaceForItsRecord) {
    EXPECT_LT(MARUSpaceBuildFileGet(nullptr), 0);
    MARUSpaceBuildFileObjFree(nullptr);
}

TEST_F(SpaceBuild, GivesEachCallerARecordOfItsOwn) {
    writeFile(SPACE_BUILD_FILE, "");
    MARUSpaceBuildFile* first = nullptr;
    MARUSpaceBuildFile* second = nullptr;

    EXPECT_EQ(0, MARUSpaceBuildFileGet(&first));
    EXPECT_EQ(0, MARUSpaceBuildFileGet(&second));

    EXPECT_NE(first, second);
    MARUSpaceBuildFileObjFree(first);
    MARUSpaceBuildFileObjFree(second);
}
