#include <marubackup-util/option_map.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <vector>

#include <gtest/gtest.h>

#include "support/files.h"
#include "support/in_child.h"
#include "support/nobody.h"
#include "support/temp_dir.h"

using MARU::Backup::OptionMap;
using support::TempDir;
using support::writeFile;

namespace {

using Words = std::list<std::string>;

const char ABSENT[] = "(absent)";

class OptionMaps : public testing::Test {
protected:
    bool load(const std::string& content, const std::string& section = "s") {
        writeFile(file, content);
        return options.optSectionLoad(file, section, -1);
    }

    std::string get(const std::string& key) const {
        std::string value;
        return options.optGet(key, value, false) ? value : ABSENT;
    }

    /** The words of the value `text`; one word, ABSENT, if there is no list of them. */
    Words wordsOf(const std::string& text) {
        EXPECT_TRUE(load("[s]\nlist=" + text)) << text;
        Words words = {ABSENT};
        const bool got = options.optGet("list", words);
        EXPECT_TRUE(got || words == Words{ABSENT}) << text << " failed and yet changed the list";
        return words;
    }

    /** The number `text`, or -12345 if it is none. */
    int numberOf(const std::string& text) {
        EXPECT_TRUE(load("[s]\nnumber=" + text)) << text;
        int number = -12345;
        const bool got = options.optGet("number", number);
        EXPECT_TRUE(got || number == -12345) << text << " failed and yet changed the number";
        return number;
    }

    const TempDir dir;
    const std::string file = dir.path("x.conf");
    OptionMap options;
};

} // namespace

TEST_F(OptionMaps, HoldTheOptionsOfOneSection) {
    ASSERT_TRUE(load("[backup]\na = 1\nb = 2\n[restore]\na = 3\nc = 4\n", "backup"));

    EXPECT_EQ("1", get("a"));
    EXPECT_EQ("2", get("b"));
    EXPECT_EQ(ABSENT, get("c"));
}

TEST_F(OptionMaps, MayHoldASectionWithoutOptions) {
    EXPECT_TRUE(load("[other]\na=1\n[s]"));
    EXPECT_EQ(ABSENT, get("a"));
}

TEST_F(OptionMaps, HoldNothingBeforeTheFirstLoad) {
    EXPECT_EQ(ABSENT, get("a"));
    EXPECT_EQ(ABSENT, get(""));
}

TEST_F(OptionMaps, SkipCommentsAndEmptyLines) {
    ASSERT_TRUE(load("# one\n\n  ; two [x\n[s]\n \t \n\t#a = 1\n;b = 2\nc = 3\n"));

    EXPECT_EQ(ABSENT, get("a"));
    EXPECT_EQ(ABSENT, get("#a"));
    EXPECT_EQ(ABSENT, get("b"));
    EXPECT_EQ("3", get("c"));
}

TEST_F(OptionMaps, DoNotCountBlanksAroundSectionsKeysAndValues) {
    ASSERT_TRUE(load(" [\t s ] \n\ta\t =\t 1 2 \t\nb=\nc = \t \nd d=4"));

    EXPECT_EQ("1 2", get("a"));
    EXPECT_EQ("", get("b"));
    EXPECT_EQ("", get("c"));
    EXPECT_EQ("4", get("d d"));
}

TEST_F(OptionMaps, ReadFilesWithCarriageReturns) {
    ASSERT_TRUE(load("\r\n[s]\r\na = 1\r\n\t \r\nb =\r\nc = x\ry\r\n"));

    EXPECT_EQ("1", get("a"));
    EXPECT_EQ("", get("b"));
    EXPECT_EQ("x\ry", get("c"));
}

TEST_F(OptionMaps, TakeAValueLiterally) {
    const std::string value = "a;b # c = \"d\" 'e' \\f [g] {{H}} $I \xff\x01 ; j";

    ASSERT_TRUE(load("[s]\nkey = " + value + "\n"));

    EXPECT_EQ(value, get("key"));
}

TEST_F(OptionMaps, TakeANulForAByte) {
    const std::string value("a\0b", 3);

    ASSERT_TRUE(load("[s]\nkey=" + value + "\nnext=2"));

    EXPECT_EQ(value, get("key"));
    EXPECT_EQ("2", get("next"));
}

TEST_F(OptionMaps, TakeTheLastOfARepeatedKey) {
    ASSERT_TRUE(load("[s]\na=1\na=2\n[t]\na=3\n"));

    EXPECT_EQ("2", get("a"));
}

TEST_F(OptionMaps, PutThePiecesOfASectionTogether) {
    ASSERT_TRUE(load("[s]\na=1\nb=1\n[t]\nb=0\n[s]\nb=2\nc=2\n"));

    EXPECT_EQ("1", get("a"));
    EXPECT_EQ("2", get("b"));
    EXPECT_EQ("2", get("c"));
}

TEST_F(OptionMaps, TellNamesApartByTheirCase) {
    ASSERT_TRUE(load("[S]\na=0\n[s]\nA=1\n"));

    EXPECT_EQ("1", get("A"));
    EXPECT_EQ(ABSENT, get("a"));
}

TEST_F(OptionMaps, IgnoreOptionsBeforeTheFirstSection) {
    ASSERT_TRUE(load("a=1\n[s]\nb=2\n"));

    EXPECT_EQ(ABSENT, get("a"));
    EXPECT_FALSE(load("a=1\n"));
    EXPECT_FALSE(load("a=1\n", ""));
}

TEST_F(OptionMaps, RefuseAFileWithoutTheSection) {
    EXPECT_FALSE(load(""));
    EXPECT_FALSE(load("[t]\na=1\n"));
    EXPECT_FALSE(load("#[s]\na=1\n"));
    EXPECT_FALSE(load("[s]\na=1\n", ""));
}

TEST_F(OptionMaps, RefuseAFileWithAMalformedLineAnywhere) {
    for (const char* line : {"word", "[s", "[s] x", "[s] # x", "[s]]", "s]", "[]", "[ ]", "= value", " = ", "=",
                             "\xef\xbb\xbf[s]", "x\r", "\v"}) {
        EXPECT_FALSE(load(std::string(line) + "\n[s]\na=1\n")) << "before: " << line;
        EXPECT_FALSE(load("[s]\na=1\n" + std::string(line))) << "inside: " << line;
        EXPECT_FALSE(load("[s]\na=1\n[t]\n" + std::string(line) + "\n")) << "behind: " << line;
        EXPECT_EQ(ABSENT, get("a")) << line;
    }
}

TEST_F(OptionMaps, ForgetTheOldSectionAtEachLoad) {
    ASSERT_TRUE(load("[s]\na=1\n[t]\nb=2\n"));

    EXPECT_TRUE(options.optSectionLoad(file, "t", -1));
    EXPECT_EQ(ABSENT, get("a"));
    EXPECT_EQ("2", get("b"));

    for (const char* bad : {"[none]\n", "[t]\nc=3\nword\n"}) {
        ASSERT_TRUE(load("[t]\nb=2\n", "t"));
        EXPECT_FALSE(load(bad, "t"));
        EXPECT_EQ(ABSENT, get("b")) << bad;
        EXPECT_EQ(ABSENT, get("c")) << bad;
    }
    ASSERT_TRUE(load("[t]\nb=2\n", "t"));
    EXPECT_FALSE(options.optSectionLoad(dir.path("missing"), "t", -1));
    EXPECT_EQ(ABSENT, get("b"));
}

TEST_F(OptionMaps, ForgetEverythingWhenCleared) {
    ASSERT_TRUE(load("[s]\na=1\n"));

    options.optClear();

    EXPECT_EQ(ABSENT, get("a"));
}

TEST_F(OptionMaps, RefuseWhatIsNoRegularFile) {
    const std::string fifo = dir.path("fifo");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));

    EXPECT_FALSE(options.optSectionLoad(dir.path("missing"), "s", -1));
    EXPECT_FALSE(options.optSectionLoad(file + "/x", "s", -1));
    EXPECT_FALSE(options.optSectionLoad(dir.path(), "s", -1));
    EXPECT_FALSE(options.optSectionLoad(fifo, "s", -1));
    EXPECT_FALSE(options.optSectionLoad("/dev/zero", "s", -1));
    EXPECT_FALSE(options.optSectionLoad("", "s", -1));
}

TEST_F(OptionMaps, RefuseAPipeWhateverItHolds) {
    const std::string content = "[s]\na=1\n";
    int ends[2];
    ASSERT_EQ(0, pipe2(ends, O_CLOEXEC));
    EXPECT_EQ(static_cast<ssize_t>(content.size()), write(ends[1], content.data(), content.size()));
    close(ends[1]);

    EXPECT_FALSE(options.optSectionLoad("/proc/self/fd/" + std::to_string(ends[0]), "s", -1));

    close(ends[0]);
}

TEST_F(OptionMaps, RefuseANameThatTheKernelWouldCutShort) {
    ASSERT_TRUE(load("[s]\na=1\n"));

    EXPECT_FALSE(options.optSectionLoad(file + std::string("\0.conf", 6), "s", -1));
}

TEST_F(OptionMaps, RefuseAFileThatWeMayNotRead) {
    ASSERT_TRUE(load("[s]\na=1\n"));
    ASSERT_EQ(0, chmod(dir.path().c_str(), 0755));
    ASSERT_EQ(0, chmod(file.c_str(), 0));

    const int status = support::runInChild([this] {
        if (geteuid() == 0) {
            support::becomeNobody();
        }
        return options.optSectionLoad(file, "s", -1) ? 1 : 0;
    });

    EXPECT_EQ("exit 0", support::describeStatus(status));
}

TEST_F(OptionMaps, ReadALineOfAMegabyteAndRefuseAFileWithoutEnd) {
    const std::string value(1024 * 1024, 'x');
    ASSERT_TRUE(load("[s]\na=" + value + "\nb=2"));
    EXPECT_TRUE(get("a") == value);
    EXPECT_EQ("2", get("b"));

    const off_t terabyte = off_t(1) << 40;
    ASSERT_EQ(0, truncate(file.c_str(), terabyte));
    EXPECT_FALSE(options.optSectionLoad(file, "s", -1));
}

TEST_F(OptionMaps, LeaveNoDescriptorOpen) {
    const int before = open("/dev/null", O_RDONLY | O_CLOEXEC);
    close(before);

    load("[s]\na=1\n");
    options.optSectionLoad(dir.path(), "s", -1);

    const int after = open("/dev/null", O_RDONLY | O_CLOEXEC);
    close(after);
    EXPECT_EQ(before, after);
}

TEST_F(OptionMaps, LeaveTheOutputAsItIsForAMissingKey) {
    ASSERT_TRUE(load("[s]\na=1\n"));
    std::string text = "kept";
    Words words = {"kept"};
    int number = 42;

    EXPECT_FALSE(options.optGet("b", text, false));
    EXPECT_FALSE(options.optGet("b", words));
    EXPECT_FALSE(options.optGet("b", number));

    EXPECT_EQ("kept", text);
    EXPECT_EQ(Words{"kept"}, words);
    EXPECT_EQ(42, number);
}

TEST_F(OptionMaps, SplitAListAtBlanks) {
    EXPECT_EQ(Words{}, wordsOf(""));
    EXPECT_EQ(Words{"/bin/true"}, wordsOf("/bin/true"));
    EXPECT_EQ((Words{"a", "b", "c"}), wordsOf("a b\t \tc"));
    EXPECT_EQ((Words{"a,b", "c;d", "#e"}), wordsOf("a,b c;d #e"));
}

TEST_F(OptionMaps, ReplaceTheListThatTheyAreGiven) {
    ASSERT_TRUE(load("[s]\nlist = a\n"));
    Words words = {"old", "older"};

    EXPECT_TRUE(options.optGet("list", words));

    EXPECT_EQ(Words{"a"}, words);
}

TEST_F(OptionMaps, TakeWhatStandsInQuotesForOneWord) {
    EXPECT_EQ((Words{"a b", "c\td"}), wordsOf("'a b' \"c\td\""));
    EXPECT_EQ((Words{"", "", "x"}), wordsOf("'' \"\" x"));
    EXPECT_EQ(Words{"a'b'c\"d\""}, wordsOf("\"a'b'\"c'\"d\"'"));
    EXPECT_EQ(Words{"--name=a b"}, wordsOf("--name='a b'"));
}

TEST_F(OptionMaps, TakeWhatFollowsABackslashLiterally) {
    EXPECT_EQ((Words{"a b", "c\\d"}), wordsOf("a\\ b c\\\\d"));
    EXPECT_EQ(Words{"'\"x"}, wordsOf("\\'\\\"\\x"));
}

TEST_F(OptionMaps, KeepMostBackslashesInQuotes) {
    EXPECT_EQ(Words{"a\"b\\c\\nd\\'"}, wordsOf("\"a\\\"b\\\\c\\nd\\'\""));
    EXPECT_EQ(Words{"a\\\"\\\\"}, wordsOf("'a\\\"\\\\'"));
}

TEST_F(OptionMaps, ExpandNothingInAList) {
    EXPECT_EQ((Words{"$HOME", "`id`", "~", "*", "{{A", "B}}", "a|b", ">c", "&"}),
              wordsOf("$HOME `id` ~ * {{A B}} a|b >c &"));
}

TEST_F(OptionMaps, RefuseAListWithAQuoteOrBackslashThatIsNotEnded) {
    for (const char* text : {"'", "\"", "a 'b", "a \"b", "'a\\'b'", "\"a\\\"", "\"a\\", "a\\", "\\", "a \\ "}) {
        EXPECT_EQ(Words{ABSENT}, wordsOf(text)) << text;
    }
}

TEST_F(OptionMaps, ReadADecimalNumber) {
    EXPECT_EQ(0, numberOf("0"));
    EXPECT_EQ(10, numberOf("010"));
    EXPECT_EQ(-20, numberOf(" -20 "));
    EXPECT_EQ(19, numberOf("+19"));
    EXPECT_EQ(INT_MAX, numberOf("2147483647"));
    EXPECT_EQ(INT_MIN, numberOf("-2147483648"));
}

TEST_F(OptionMaps, RefuseANumberThatIsNone) {
    const std::vector<std::string> texts = {"",           "x",           "1x",
                                            "1 2",        "1.0",         "0x10",
                                            "+",          "-",           "+-1",
                                            "-+1",        "++1",         "+ 1",
                                            "2147483648", "-2147483649", "99999999999999999999",
                                            "'1'",        "1;",          std::string("1\0", 2)};
    for (const std::string& text : texts) {
        EXPECT_EQ(-12345, numberOf(text)) << text;
    }
}
