#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "process_state.h"
#include "server_process.h"
#include "support/files.h"
#include "support/waiting.h"

namespace fs = std::filesystem;

using MARU::Backup::CommandServer;
using support::expectLocated;
using support::writeFile;

namespace {

using Reports = std::vector<std::string>;

std::string nameOf(const inotify_event& event) {
    return std::string(event.name, strnlen(event.name, event.len));
}

/** Reports "CREATE name" or the like, and nothing about events of other kinds than `mask`. */
CommandServer::WatchHandler reportingEvents(const std::string& what, std::uint32_t mask) {
    return [what, mask](inotify_event* event) {
        if ((event->mask & mask) != 0) {
            report(what + " " + nameOf(*event));
        }
    };
}

CommandServer::WatchHandler reportingNewFiles(const std::string& what = "new") {
    return reportingEvents(what, IN_CREATE);
}

class CommandServerWatch : public ServerTest {
protected:
    CommandServerWatch() {
        fs::create_directory(watched);
    }

    /** A server that watches the folder. */
    ServerOptions watching(const CommandServer::WatchHandler& handler) const {
        ServerOptions options;
        options.setUp = [this, handler](CommandServer& server) { server.setWatchFolder(watched, handler); };
        return options;
    }

    std::string file(const std::string& name) const {
        return watched + "/" + name;
    }

    const std::string watched = folder.path("watched");
};

/** Queues what `work` causes, so that the server finds all of it at once. */
void atOnce(const ServerProcess& server, const std::function<void()>& work) {
    server.signal(SIGSTOP);
    work();
    server.signal(SIGCONT);
}

/** A name of this length that begins with `number`. */
std::string longName(int number, std::size_t length) {
    std::string name = std::to_string(number) + "-";
    name.resize(std::max(name.size(), length), 'n');
    return name;
}

} // namespace

TEST_F(CommandServerWatch, ReportsANewFileWithItsName) {
    ServerProcess server(path, watching(reportingNewFiles()));

    writeFile(file("backend.conf"), "");

    EXPECT_EQ("new backend.conf", server.waitForReport("new"));
}

TEST_F(CommandServerWatch, ReportsNamesOfEveryLength) {
    ServerProcess server(path, watching(reportingNewFiles()));
    for (std::size_t length = 1; length <= 255; ++length) {
        const std::string name(length, 'n');

        writeFile(file(name), "");

        EXPECT_EQ("new " + name, server.waitForReport("new"));
    }
}

TEST_F(CommandServerWatch, ReportsEveryKindOfEvent) {
    ServerProcess server(path, watching([](inotify_event* event) {
                             report(std::to_string(event->mask & ~std::uint32_t{IN_ISDIR}) + " " + nameOf(*event));
                         }));
    const auto expectEvent = [&server](std::uint32_t mask, const std::string& name) {
        server.waitForReport(std::to_string(mask) + " " + name);
    };

    writeFile(file("a"), "content");
    support::readFile(file("a"));
    chmod(file("a").c_str(), 0600);
    fs::rename(file("a"), file("b"));
    fs::remove(file("b"));
    fs::rename(watched, folder.path("elsewhere"));
    fs::remove(folder.path("elsewhere"));

    expectEvent(IN_CREATE, "a");
    expectEvent(IN_OPEN, "a");
    expectEvent(IN_MODIFY, "a");
    expectEvent(IN_CLOSE_WRITE, "a");
    expectEvent(IN_ACCESS, "a");
    expectEvent(IN_CLOSE_NOWRITE, "a");
    expectEvent(IN_ATTRIB, "a");
    expectEvent(IN_MOVED_FROM, "a");
    expectEvent(IN_MOVED_TO, "b");
    expectEvent(IN_DELETE, "b");
    expectEvent(IN_MOVE_SELF, "");
    expectEvent(IN_DELETE_SELF, "");
    expectEvent(IN_IGNORED, ""); // the watch has ended with its folder
    EXPECT_EQ("served", server.ask("served"));
}

TEST_F(CommandServerWatch, TellsTheTwoEndsOfARenameByTheirCookie) {
    ServerProcess server(path, watching([](inotify_event* event) {
                             if ((event->mask & IN_MOVE) != 0) {
                                 report("cookie " + std::to_string(event->cookie));
                             }
                         }));
    writeFile(file("a"), "");

    fs::rename(file("a"), file("b"));

    const std::string from = server.waitForReport("cookie");
    EXPECT_EQ(from, server.waitForReport("cookie"));
    EXPECT_NE("cookie 0", from);
}

TEST_F(CommandServerWatch, LosesNothingOfAThousandFilesThatAreMadeAtOnce) {
    ServerProcess server(path, watching(reportingNewFiles()));
    const int number = 1000;
    const auto nameOfFile = [](int index) { return longName(index, static_cast<std::size_t>(index * 7 % 256)); };

    atOnce(server, [&]() {
        for (int index = 0; index < number; ++index) {
            writeFile(file(nameOfFile(index)), "content");
        }
    });

    for (int index = 0; index < number; ++index) {
        ASSERT_EQ("new " + nameOfFile(index), server.waitForReport("new"));
    }
    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ(static_cast<std::size_t>(number), server.reports().size());
}

TEST_F(CommandServerWatch, LosesNothingOfTheLongestNames) {
    ServerProcess server(path, watching(reportingNewFiles()));
    const int number = 300;

    atOnce(server, [&]() {
        for (int index = 0; index < number; ++index) {
            writeFile(file(longName(index, 255)), "");
        }
    });

    for (int index = 0; index < number; ++index) {
        ASSERT_EQ("new " + longName(index, 255), server.waitForReport("new"));
    }
}

TEST_F(CommandServerWatch, ReportsAFolderThatIsMissingAndWatchesTheOthers) {
    const std::string other = folder.path("zzz");
    fs::create_directory(other);
    const std::string missing = folder.path("missing");
    const std::string alsoMissing = folder.path("xxx/yyy");
    ServerOptions options;
    options.setUp = [&](CommandServer& server) {
        for (const std::string& one : {missing, watched, alsoMissing, other}) {
            report(server.setWatchFolder(one, reportingNewFiles(one)) ? "registered" : "refused");
        }
    };
    ServerProcess server(path, options);

    expectLocated(log, LOG_ERR, server.pid(), "command_server", "add watch to [" + missing + "] failed");
    expectLocated(log, LOG_ERR, server.pid(), "command_server", "add watch to [" + alsoMissing + "] failed");
    EXPECT_EQ(2U, log.lines().size());
    EXPECT_EQ(4, server.countReports("registered"));
    writeFile(file("a"), "");
    EXPECT_EQ(watched + " a", server.waitForReport(watched));
    writeFile(other + "/b", "");
    EXPECT_EQ(other + " b", server.waitForReport(other));
}

TEST_F(CommandServerWatch, DoesNotBeginForAFolderThatIsMadeLater) {
    const std::string late = folder.path("late");
    ServerOptions options;
    options.setUp = [&](CommandServer& server) {
        server.setWatchFolder(late, reportingNewFiles("late"));
        server.setWatchFolder(watched, reportingNewFiles("watched"));
    };
    ServerProcess server(path, options);

    fs::create_directory(late);
    writeFile(late + "/a", "");
    writeFile(file("b"), "");
    server.waitForReport("watched b");

    EXPECT_EQ(Reports{"watched b"}, server.reports());
}

TEST_F(CommandServerWatch, RunsWithNoFolderThatCanBeWatched) {
    ServerOptions options;
    options.setUp = [](CommandServer& server) { server.setWatchFolder("", reportingNewFiles()); };
    ServerProcess server(path, options);

    expectLocated(log, LOG_ERR, server.pid(), "command_server", "add watch to [] failed");
    EXPECT_EQ("served", server.ask("served"));
}

TEST_F(CommandServerWatch, OfOneFolderUnderTwoPathsCallsTheHandlerOfTheLaterPath) {
    ServerOptions options;
    options.setUp = [this](CommandServer& server) {
        server.setWatchFolder(watched + "/", reportingNewFiles("with a slash")); // sorts behind the other
        server.setWatchFolder(watched, reportingNewFiles("without"));
    };
    ServerProcess server(path, options);

    writeFile(file("a"), "");
    server.waitForReport("with a slash a");

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ(Reports{"with a slash a"}, server.reports());
}

TEST_F(CommandServerWatch, RegisteredTwiceKeepsTheSecondHandler) {
    ServerOptions options;
    options.setUp = [this](CommandServer& server) {
        server.setWatchFolder(watched, reportingNewFiles("first"));
        server.setWatchFolder(watched, reportingNewFiles("second"));
    };
    ServerProcess server(path, options);

    writeFile(file("a"), "");
    server.waitForReport("second a");

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ(Reports{"second a"}, server.reports());
}

TEST_F(CommandServerWatch, IsNotChangedByRegistrationsWhileTheLoopRuns) {
    const std::string other = folder.path("other");
    fs::create_directory(other);
    ServerOptions options = watching(reportingNewFiles("old"));
    options.handler = doing([&](CommandServer& running) {
        report(running.setWatchFolder(watched, reportingNewFiles("new")) ? "replaced" : "refused");
        report(running.setWatchFolder(other, reportingNewFiles("other")) ? "registered" : "refused");
    });
    ServerProcess server(path, options);

    server.ask("register");
    writeFile(other + "/a", "");
    writeFile(file("b"), "");
    server.waitForReport("old b");

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ((Reports{"replaced", "registered", "old b"}), server.reports());
}

TEST_F(CommandServerWatch, WithoutAHandlerEndsTheLoopWithAnException) {
    ServerProcess server(path, watching(CommandServer::WatchHandler()));

    writeFile(file("a"), "");

    EXPECT_EQ(EMPTY_CALL, server.wait());
}

TEST_F(CommandServerWatch, EndsTheLoopWithAnExceptionWhenEventsWereLost) {
    const int room = std::stoi(support::readFile("/proc/sys/fs/inotify/max_queued_events"));
    writeFile(file("a"), "");
    writeFile(file("b"), "");
    ServerProcess server(path, watching([](inotify_event*) {}));

    atOnce(server, [&]() {
        for (int events = 0; events < room + 10; ++events) { // the kernel drops what repeats the event before it
            close(open(file(events % 2 == 0 ? "a" : "b").c_str(), O_RDONLY | O_CLOEXEC));
        }
    });

    EXPECT_EQ(EMPTY_CALL, server.wait());
}
