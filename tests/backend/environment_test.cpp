#include <syslog.h>
#include <unistd.h>

#include <ostream>
#include <sstream>
#include <tuple>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backend_fixture.h"

using namespace MARU::Backup;
using support::expectLocated;
using testing::Contains;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

namespace {

/** What the shell was given, which is more than it passes on: names that it does not understand too. */
const char* const WRITE_ENVIRONMENT = "/bin/sh -c 'tr \"\\0\" \"\\n\" < /proc/$$/environ | sort > {{out}}'";

enum class Way { CHECK, LAUNCH };

std::ostream& operator<<(std::ostream& out, Way way) {
    return out << (way == Way::CHECK ? "Check" : "Launch");
}

/** What a section sets in its command's environment, of the variables that begin with "MB_". */
struct Setting {
    const char* name;
    const char* eviron; ///< null without the key
    std::vector<std::string> variables;
    bool reported;

    friend std::ostream& operator<<(std::ostream& out, const Setting& row) {
        return out << row.name;
    }
};

class BackendEnvironmentKey : public BackendTest {};

class BackendEnvironment : public BackendTest, public testing::WithParamInterface<std::tuple<Way, Setting>> {
protected:
    /** Runs the command, which writes its environment into "out"; the process that set it up. */
    pid_t run() {
        pid_t runner = getpid();
        if (std::get<Way>(GetParam()) == Way::CHECK) {
            EXPECT_TRUE(backend.check(job));
        } else {
            EXPECT_EQ("exit 0", launch(runner));
        }
        return runner;
    }

    std::vector<std::string> ourVariables() const {
        std::vector<std::string> ours;
        for (const std::string& line : outLines()) {
            if (line.rfind("MB_", 0) == 0) {
                ours.push_back(line);
            }
        }
        return ours;
    }
};

// A well-formed object is refused; variables come from a text that is none, but
// leaves an object behind.
const Setting SETTINGS[] = {
    {"Absent", nullptr, {}, false},

    {"Object", R"({"MB_A":"1"})", {}, true},
    {"EmptyObject", "{}", {}, true},
    {"Array", R"(["MB_A"])", {}, true},
    {"Text", R"("MB_A")", {}, true},
    {"Null", "null", {}, true},

    {"NoText", "", {}, true},
    {"NoJson", "MB_A=1", {}, true},
    {"ArrayAndMore", R"(["MB_A"] x)", {}, true},

    {"ObjectAndMore", R"({"MB_A":"1"} x)", {"MB_A=1"}, false},
    {"Templates",
     R"({"MB_A":"{{name}}","MB_B":"<{{JOB_ID}}{{missing}}>"} x)",
     {"MB_A=n", "MB_B=<A{{missing}}>"},
     false},
    {"NameIsNoTemplate", R"({"MB_{{name}}":"1"} x)", {"MB_{{name}}=1"}, false},
    {"NumbersBoolsAndNull",
     R"({"MB_A":5,"MB_B":true,"MB_C":1.5,"MB_D":null} x)",
     {"MB_A=5", "MB_B=true", "MB_C=1.5", "MB_D="},
     false},
    {"MembersWithoutATextForm", R"({"MB_A":["1"],"MB_B":{"MB_C":"1"},"MB_D":"4"} x)", {"MB_D=4"}, false},
    {"EmptyObjectAndMore", "{} x", {}, false},
};

INSTANTIATE_TEST_SUITE_P(Of, BackendEnvironment,
                         testing::Combine(testing::Values(Way::CHECK, Way::LAUNCH), testing::ValuesIn(SETTINGS)),
                         [](const auto& row) {
                             std::ostringstream name;
                             name << std::get<Way>(row.param) << "With" << std::get<Setting>(row.param);
                             return name.str();
                         });

} // namespace

TEST_P(BackendEnvironment, ReachesTheCommandOrIsReported) {
    const Setting& setting = std::get<Setting>(GetParam());
    job.setJobId(65);
    load(std::string("command_check = ") + WRITE_ENVIRONMENT + "\ncommand_launch = " + WRITE_ENVIRONMENT + "\n" +
         (setting.eviron != nullptr ? std::string("eviron = ") + setting.eviron : ""));

    const pid_t runner = run();

    EXPECT_EQ(setting.variables, ourVariables());
    EXPECT_THAT(outLines(), Contains(StartsWith("PATH="))) << "what is inherited stays";
    if (setting.reported) {
        expectLocated(log, LOG_ERR, runner, BACKEND_UNIT, "wrong config: bad env");
    }
    EXPECT_EQ(setting.reported ? 1U : 0U, log.lines().size());
}

TEST_F(BackendEnvironmentKey, HasOneSpelling) {
    load(std::string("command_check = ") + WRITE_ENVIRONMENT +
         "\n"
         "environ = {\"MB_A\":\"1\"} x\nEVIRON = {\"MB_A\":\"1\"} x\neviron_ = {\"MB_A\":\"1\"}");

    EXPECT_TRUE(backend.check(job));

    EXPECT_THAT(outLines(), Not(Contains(StartsWith("MB_A"))));
    EXPECT_THAT(log.lines(), IsEmpty());
}
