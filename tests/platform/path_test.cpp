#include <marubackup-util/path.h>

#include <gtest/gtest.h>

using MARU::Backup::Path;

TEST(PathJoin, PutsOneSlashBetweenFolderAndName) {
    EXPECT_EQ("/etc/a.conf", Path::join("/etc", "a.conf"));
    EXPECT_EQ("etc/a/b", Path::join("etc", "a/b"));
}

TEST(PathJoin, MakesOneSlashOfThoseThatMeet) {
    EXPECT_EQ("/etc/a", Path::join("/etc/", "a"));
    EXPECT_EQ("/etc/a", Path::join("/etc", "/a"));
    EXPECT_EQ("/etc/a", Path::join("/etc///", "//a"));
    EXPECT_EQ("/a", Path::join("/", "a"));
    EXPECT_EQ("/etc/", Path::join("/etc", "/"));
    EXPECT_EQ("/", Path::join("/", "/"));
    EXPECT_EQ("/", Path::join("//", "///"));
}

TEST(PathJoin, AddsNothingForAnEmptyPart) {
    EXPECT_EQ("a", Path::join("", "a"));
    EXPECT_EQ("/a", Path::join("", "/a"));
    EXPECT_EQ("etc", Path::join("etc", ""));
    EXPECT_EQ("etc/", Path::join("etc/", ""));
    EXPECT_EQ("", Path::join("", ""));
}

TEST(PathJoin, LeavesEverythingElseAsItIs) {
    EXPECT_EQ("//a//b/../c//d/", Path::join("//a//b", "../c//d/"));
    EXPECT_EQ("./a", Path::join(".", "a"));
}
