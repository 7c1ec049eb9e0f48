// Names, branches and variables that no well-meaning client asks for and no
// operator writes: they lead nowhere, and neither the daemon nor its jobs take harm.

#include <unistd.h>

#include <filesystem>
#include <ostream>

#include "hostile_test.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/named_rows.h"

using namespace MARU::Backup;

// Backends' names

using HostileBranches = HostileTest;

namespace {

struct Trap {
    std::string name; ///< as it stands in JSON
    std::string file; ///< where a daemon that is led astray would look; empty if nothing can be there
    int code;
};

const std::string LOCAL = support::LOCAL_BACKEND_FOLDER;
const std::string SYSTEM = support::SYSTEM_BACKEND_FOLDER;

const Trap TRAPS[] = {
    {"../trap", "/usr/local/share/trap.conf", 505},
    {"../trap", "/usr/maru/share/trap.conf", 505},
    {"../marubackup/trap", LOCAL + "/trap.conf", 505},
    {"../../../../run/trap", "/run/trap.conf", 505},
    {"/run/trap", "/run/trap.conf", 505},
    {"/run/trap", LOCAL + "/run/trap.conf", 505},
    {"\\/run\\/trap", "/run/trap.conf", 505},
    {"\\u002frun\\u002ftrap", "/run/trap.conf", 505},
    {"//run/trap", "/run/trap.conf", 505},
    {"/etc/passwd", "", 505},
    {"/etc/passwd\\u0000", "", 505},
    {"sub/trap", LOCAL + "/sub/trap.conf", 505},
    {"sub/trap", SYSTEM + "/sub/trap.conf", 505},
    {"sub/", LOCAL + "/sub/.conf", 505},
    {"sub/../trap", LOCAL + "/trap.conf", 505},
    {"./trap", LOCAL + "/trap.conf", 505},
    {"/trap", LOCAL + "/trap.conf", 505},
    {"trap\\u0000", LOCAL + "/trap", 505},
    {"trap\\u0000x", LOCAL + "/trap", 505},
    {"trap.conf\\u0000", LOCAL + "/trap.conf", 505},
    {"trap.conf", LOCAL + "/trap.conf", 505},
    {"TRAP", LOCAL + "/trap.conf", 505},
    {"trap\\n", LOCAL + "/trap.conf", 505},
    {" trap", LOCAL + "/trap.conf", 505},
    {"*", LOCAL + "/trap.conf", 505},
    {"{{BACKEND}}", LOCAL + "/trap.conf", 505},
    {"\\u0000", LOCAL + "/.conf", 505},
    {"/", LOCAL + "/.conf", 505},
    {".", LOCAL + "/.conf", 505},
    {".", "/usr/local/share/marubackup.conf", 505},
    {"..", "/usr/local/share/.conf", 505},
    {"..", "/usr/local/share.conf", 505},
    {std::string(4096, 'x'), "", 505},
    {repeated("./", 2046) + "trap", LOCAL + "/trap.conf", 505},
    {repeated("./", 1000) + "trap", LOCAL + "/trap.conf", 505},
    {"", LOCAL + "/.conf", 400},
};

class HostileBackendName : public HostileTest {
protected:
    HostileBackendName() {
        const std::string command = "touch " + proof + "\n";
        const std::string text = everyAction("command_check = " + command + "command_launch = " + command);
        for (const Trap& trap : TRAPS) {
            if (!trap.file.empty()) {
                std::filesystem::create_directories(std::filesystem::path(trap.file).parent_path());
                support::writeFile(trap.file, text);
            }
        }
    }
    ~HostileBackendName() override {
        for (const Trap& trap : TRAPS) {
            std::filesystem::remove(trap.file);
        }
    }

    const std::string proof = folder.path("proof");
};

} // namespace

TEST_F(HostileBackendName, LeadsToNoFileOfTheClientsChoice) {
    for (const Trap& trap : TRAPS) {
        expectCode(trap.code, enqueue(jobOf(trap.name)));
        EXPECT_FALSE(std::filesystem::exists(proof)) << trap.name;
    }
    expectUnharmed();

    // The same file under an honest name is a backend like any other.
    daemon->waitForLine(exitLine(add(Job("trap", Job::ACTION_RELINK)), 0));
    EXPECT_TRUE(std::filesystem::exists(proof));
    expectUnharmed(1);
}

// Branches

namespace {

struct Branch {
    const char* name;
    std::string branch;
    std::string key; ///< of the file's only other command but for the default one and the check
    bool runs;       ///< whether that is the job's command

    friend std::ostream& operator<<(std::ostream& out, const Branch& row) {
        return out << row.name;
    }
};

class HostileBranch : public HostileTest, public testing::WithParamInterface<Branch> {};

const Branch BRANCHES[] = {
    {"OneSlash", "a/b", "command_a/b", true},
    {"SlashesThatLeadUp", "../../bin/sh", "command_../../bin/sh", true},
    {"Blank", "a b", "command_a b", true},
    {"Tab", "a\tb", "command_a\tb", true},
    {"ByteOfOnes", "\xff", "command_\xff", true},
    {"Variable", "{{BACKEND}}", "command_{{BACKEND}}", true},
    {"Bracket", "]", "command_]", true},
    {"Long", std::string(4096, 'b'), "command_" + std::string(4096, 'b'), true},

    {"LongAndUnknown", std::string(4096, 'b'), "command_" + std::string(4095, 'b'), false},
    {"SlashesThatLeadBack", "x/../a", "command_a", false},
    {"LeadingSlash", "/a", "command_a", false},
    {"OnlySlash", "/", "command_", false},
    {"OnlyBlank", " ", "command_", false},
    {"LeadingBlank", " a", "command_a", false},
    {"TrailingBlank", "a ", "command_a", false},
    {"TrailingNewLine", "a\n", "command_a", false},
    {"LineOfItsOwn", "a\ncommand_b = touch x", "command_a", false},
    {"Section", "a\n[relink]", "command_a", false},
    {"Equals", "a=b", "command_a=b", false},
    {"TrailingNul", "a" + NUL, "command_a", false},
    {"Nul", NUL, "command_", false},
    {"UpperCase", "A", "command_a", false},
    {"WholeKey", "command_a", "command_a", false},
    {"BeginningOfAKey", "a", "command_ab", false},
    {"VariableThatIsAKey", "{{BACKEND}}", "command_branched", false},
    {"DefaultCommandAndANewLine", "launch\n", "command_a", false},
    {"DefaultCommandAndANul", "launch" + NUL, "command_a", false},
    {"OtherKey", "../unique", "command_a", false},
};

INSTANTIATE_TEST_SUITE_P(Of, HostileBranch, testing::ValuesIn(BRANCHES), support::NameOfRow());

} // namespace

TEST_P(HostileBranch, RunsTheCommandOfItsNameOrNone) {
    const Branch& row = GetParam();
    const std::string mark = folder.path("mark");
    support::writeLocalBackend("branched", "[relink]\ncommand_launch = touch " + folder.path("default") + "\n" +
                                               row.key + " = touch " + mark + "\n");
    Job job("branched", Job::ACTION_RELINK);
    job.setCommandBranch(row.branch);

    job = add(job);

    EXPECT_EQ(row.branch, job.getCommandBranch());
    daemon->waitForLine(exitLine(job, row.runs ? 0 : 127));
    EXPECT_EQ(row.runs, std::filesystem::exists(mark));
    EXPECT_FALSE(std::filesystem::exists(folder.path("default")));
    EXPECT_EQ(row.runs ? 0 : 1, log.count("wrong config: launch command not found"));
    expectUnharmed(1);
}

TEST_F(HostileBranches, ABranchNamedCheckRunsTheCheckAsTheJob) {
    const std::string runs = folder.path("runs");
    support::writeLocalBackend("checked", "[relink]\ncommand_launch = touch " + folder.path("default") +
                                              "\ncommand_check = /bin/sh -c 'echo run >> \"$0\"' " + runs + "\n");
    Job job("checked", Job::ACTION_RELINK);
    job.setCommandBranch("check");

    daemon->waitForLine(exitLine(add(job), 0));

    EXPECT_EQ("run\nrun\n", support::readFile(runs)) << "once to admit the job, once as the job";
    EXPECT_FALSE(std::filesystem::exists(folder.path("default")));
    expectUnharmed(1);
}

// Variables

namespace {

/** A value in `eviron`, and what it is as a variable. */
struct Value {
    const char* name;
    std::string json;
    const char* variable; ///< null where it has no text form
    bool tooDeep;         ///< so that no text that holds it is well formed

    friend std::ostream& operator<<(std::ostream& out, const Value& row) {
        return out << row.name;
    }
};

const std::string DEEP_ARRAY = repeated("[", 100) + repeated("]", 100);
const std::string DEEP_OBJECT = repeated("{\"a\":", 100) + "1" + repeated("}", 100);

const Value VALUES[] = {
    {"Null", "null", "", false},
    {"True", "true", "true", false},
    {"False", "false", "false", false},
    {"Zero", "0", "0", false},
    {"Negative", "-5", "-5", false},
    {"Largest", "18446744073709551615", "18446744073709551615", false},
    {"Real", "1.5", "1.5", false},
    {"Text", "\"a{{BACKEND}}\"", "aprobe", false},
    {"EmptyText", "\"\"", "", false},
    {"NoUtf8", "\"\xff\"", "\xff", false},
    {"VariableOfNoMeaning", "\"{{\"", "{{", false},
    {"Array", "[\"1\"]", nullptr, false},
    {"Object", "{\"MB_C\":\"1\"}", nullptr, false},
    {"DeepArray", DEEP_ARRAY, nullptr, true},
    {"DeepObject", DEEP_OBJECT, nullptr, true},
};

class HostileEnviron : public HostileTest {
protected:
    /** Runs a job whose section has this `eviron`; the variables that both its check and itself found. */
    std::vector<std::string> variablesOf(const std::string& eviron) {
        const std::string output = folder.path("output" + std::to_string(++runs));
        const std::string checked = output + ".checked";
        support::writeLocalBackend("probe", "[relink]\ncommand_check = /bin/sh -c 'env -0 > \"$0\"' " + checked +
                                                "\ncommand_launch = env -0\npipe_stdout = " + output +
                                                "\neviron = " + eviron + "\n");
        daemon->waitForLine(exitLine(add(Job("probe", Job::ACTION_RELINK)), 0));
        EXPECT_EQ(ourVariables(checked), ourVariables(output));
        return ourVariables(output);
    }

    /** How many of a job's two commands it was that found their environment to be wrong, since the last call. */
    int complaints() {
        const int before = complaintsSeen;
        complaintsSeen = log.count("wrong config: bad env");
        return complaintsSeen - before;
    }

    int runs = 0;

private:
    static std::vector<std::string> ourVariables(const std::string& file) {
        std::istringstream all(support::readFile(file));
        std::vector<std::string> ours;
        for (std::string variable; std::getline(all, variable, '\0');) {
            if (variable.rfind("MB_", 0) == 0) {
                ours.push_back(variable);
            }
        }
        std::sort(ours.begin(), ours.end());
        return ours;
    }

    int complaintsSeen = 0;
};

class HostileVariable : public HostileEnviron, public testing::WithParamInterface<Value> {};

INSTANTIATE_TEST_SUITE_P(Of, HostileVariable, testing::ValuesIn(VALUES), support::NameOfRow());

} // namespace

TEST_P(HostileVariable, ReachesTheProgramFromATextThatIsNotWellFormed) {
    const std::string text = "{\"MB_A\":\"1\",\"MB_B\":" + GetParam().json;
    std::vector<std::string> left = {"MB_A=1"};
    if (GetParam().variable != nullptr) {
        left.push_back(std::string("MB_B=") + GetParam().variable);
    }
    for (const std::string& malformed : {text, text + "} x", text + ",}", text + "}}"}) {
        EXPECT_EQ(left, variablesOf(malformed)) << malformed;
        EXPECT_EQ(0, complaints()) << malformed;
    }
    expectUnharmed(runs);
}

TEST_P(HostileVariable, DoesNotReachTheProgramFromAWellFormedText) {
    const std::string text = "{\"MB_A\":\"1\",\"MB_B\":" + GetParam().json + "}";
    const bool wellFormed = !GetParam().tooDeep;

    EXPECT_EQ(wellFormed ? std::vector<std::string>() : std::vector<std::string>{"MB_A=1"}, variablesOf(text));

    EXPECT_EQ(wellFormed ? 2 : 0, complaints());
    expectUnharmed(runs);
}

TEST_F(HostileEnviron, IsWrongIfItIsNoObject) {
    for (const Value& value : VALUES) {
        if (value.json.front() == '{') {
            continue;
        }
        for (const std::string& text : {value.json, value.json + " x", value.json + "}"}) {
            EXPECT_EQ(std::vector<std::string>(), variablesOf(text)) << text;
            EXPECT_EQ(2, complaints()) << text;
        }
    }
    expectUnharmed(runs);
}

TEST_F(HostileEnviron, EndsAJobWithoutItsProgramIfAVariableCannotBeOne) {
    const std::string proof = folder.path("proof");
    for (const char* eviron : {"{\"\":\"1\"} x", "{\"A=B\":\"1\"} x", "{\"MB_\\u0000\":\"1\"} x",
                               "{\"MB_A\":\"\\u0000\"} x", "{\"MB_A\":\"{{text}}\"} x"}) {
        support::writeLocalBackend("probe",
                                   "[relink]\ncommand_launch = touch " + proof + "\neviron = " + eviron + "\n");
        Job job("probe", Job::ACTION_RELINK);
        job.setParam("text", NUL);
        daemon->waitForLine(exitLine(add(job), 127));
        EXPECT_FALSE(std::filesystem::exists(proof)) << eviron;
        ++runs;
    }
    expectUnharmed(runs);
}
