// Which ids and which records name a session.

#include <marubackup-util/session.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include "session_fixture.h"
#include "support/files.h"
#include "support/session_areas.h"

namespace fs = std::filesystem;

using MARU::Backup::Session;
using support::isThere;
using support::OUTSIDE;
using support::readFile;
using support::sessionRecord;
using support::writeFile;

TEST_F(ASession, IsNotNamedByAnythingButLettersDigitsAndDashes) {
    Session session;
    session.create();
    const std::string id = session.getId();
    const std::string others[] = {
        "",
        "/",
        ".",
        "..",
        "../../etc",
        "../marusession-" + id,
        "/tmp/marusession-" + id,
        id + "/",
        id + "/.",
        id + ".new",
        " " + id,
        id + "\n",
        id + std::string(1, '\0'),
        std::string(1, '\0'),
        "a_b",
        "a*",
        "%s%n",
        "\xc3\xa4",
        "\xff",
        std::string(65, 'a'),
        std::string(4096, 'a'),
        std::string(1 << 20, '/'),
    };
    for (const std::string& other : others) {
        EXPECT_EQ("", Session::getPathById(other)) << other;
        EXPECT_FALSE(Session::destroyById(other)) << other;
        EXPECT_FALSE(Session().load(other)) << other;
    }
    expectKept(session);
}

TEST_F(ASession, IsGoneIfItsIdIsWellFormedAndUnknown) {
    for (const bool anyRecords : {false, true}) {
        if (anyRecords) {
            Session().create();
        }
        for (const std::string& id : {std::string("a"), std::string("0"), std::string("-"), std::string(64, 'Z')}) {
            EXPECT_EQ("", Session::getPathById(id));
            EXPECT_TRUE(Session::destroyById(id));
        }
    }
}

TEST_F(ASession, IsNotNamedByARecordThatIsTornOrLeadsElsewhere) {
    Session session;
    session.create();
    const std::string id = session.getId();
    Session other;
    other.create();
    fs::create_directory(OUTSIDE + "/marusession-" + id);
    const std::string name = "/marusession-" + id;
    const std::string texts[] = {
        "",
        "\n",
        "/tmp" + name,
        "/tmp" + name.substr(0, 20),
        "/tmp" + name + "\n\n",
        "/tmp" + name + "\n/etc\n",
        "/tmp" + name + std::string("\0\n", 2),
        "/tmp/" + name + "\n",
        "/tmp/." + name + "\n",
        "tmp" + name + "\n",
        name + "\n",
        other.getPath() + "\n",
        "/etc\n",
        "/\n",
        "/tmp\n",
        "/tmp/..\n",
        "/tmp/../etc\n",
        OUTSIDE + name + "\n",
        OUTSIDE + "\n",
        "/volume" + name + "\n",
        "/volume1/.." + name + "\n",
        "/volumes" + name + "\n",
        "/volume-1" + name + "\n",
        "/volume1234567890" + name + "\n",
        std::string(5000, '/'),
    };
    for (const std::string& text : texts) {
        writeFile(sessionRecord(id), text);

        EXPECT_EQ("", Session::getPathById(id)) << text;
        EXPECT_FALSE(Session().load(id)) << text;
        EXPECT_FALSE(Session::destroyById(id)) << text;

        EXPECT_EQ(text, readFile(sessionRecord(id))) << "whoever looks into it finds it as it is";
    }
    EXPECT_TRUE(isThere(session.getPath()));
    EXPECT_TRUE(isThere(OUTSIDE + "/marusession-" + id));
    expectKept(other);
}

TEST_F(ASession, IsNotNamedByARecordThatIsNoFileOfRootsAlone) {
    Session session;
    session.create();
    const std::string record = sessionRecord(session.getId());
    const auto expectUnusable = [&](const char* why) {
        EXPECT_EQ("", Session::getPathById(session.getId())) << why;
        EXPECT_FALSE(Session::destroyById(session.getId())) << why;
        EXPECT_TRUE(isThere(session.getPath())) << why;
    };

    chmod(record.c_str(), 0666);
    expectUnusable("anybody may have written it");
    chmod(record.c_str(), 0600);
    ASSERT_EQ(0, chown(record.c_str(), 65534, 65534));
    expectUnusable("nobody's");
    ASSERT_EQ(0, chown(record.c_str(), 0, 0));
    expectKept(session);

    fs::rename(record, ASIDE);
    fs::create_symlink(ASIDE, record);
    expectUnusable("a link");
    fs::remove(record);
    fs::create_directory(record);
    expectUnusable("a folder");
    fs::remove(record);
    ASSERT_EQ(0, mkfifo(record.c_str(), 0600));
    expectUnusable("a FIFO");
    fs::remove(record);
    fs::rename(ASIDE, record);

    chmod(support::SESSION_RECORDS.c_str(), 0777);
    expectUnusable("anybody may have put it there");
    EXPECT_FALSE(Session().create());
    chmod(support::SESSION_RECORDS.c_str(), 0700);
    fs::rename(support::SESSION_RECORDS, ASIDE);
    fs::create_directory_symlink(ASIDE, support::SESSION_RECORDS);
    expectUnusable("a link to the records");
    EXPECT_FALSE(Session().create());
    fs::remove(support::SESSION_RECORDS);
    fs::rename(ASIDE, support::SESSION_RECORDS);
    expectKept(session);
}
