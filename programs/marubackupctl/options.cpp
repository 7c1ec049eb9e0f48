#include "options.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <functional>
#include <memory>
#include <sstream>
#include <string_view>

#include <CLI/CLI.hpp>

#include "output.h"
#include "parameter.h"
#include "words.h"

namespace {

const char EXIT_STATUSES[] = R"(Exit status:
  0    done
  1    something else failed
  2    wrong usage
  3    no such job or session
  4    refused by a rule of the daemon or the backend
  5    the daemon cannot be reached
  124  timed out
  130  interrupted
"marubackupctl VERB --help" tells more. Options may stand before or after the verb.)";

const char MORE[] = "\"marubackupctl --help\" has the options of all verbs and the exit statuses.";

const std::string HINT = " (see \"marubackupctl --help\")";

const double LONGEST_TIME = 1e8;

// Validators: empty if the text will do, otherwise what is wrong with it.

std::string checkJobId(const std::string& text) {
    int jobId = 0;
    const char* end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, jobId);
    return error == std::errc() && rest == end && jobId > 0 ? "" : "\"" + text + "\" is no job id: a number from 1 up";
}

std::string checkSeconds(const std::string& text) {
    double seconds = 0;
    const char* end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, seconds);
    const bool good = error == std::errc() && rest == end && seconds >= 0 && seconds <= LONGEST_TIME;
    return good ? "" : "\"" + text + "\" is no number of seconds";
}

std::string checkTimeout(const std::string& text) {
    const std::string mistake = checkSeconds(text);
    return mistake.empty() && std::stod(text) <= 0 ? "must be more than 0 seconds" : mistake;
}

std::string checkLifetime(const std::string& text) {
    long seconds = 0;
    const char* end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, seconds);
    return error == std::errc() && rest == end ? "" : "\"" + text + "\" is no whole number of seconds";
}

std::string checkNotEmpty(const std::string& text) {
    return text.empty() ? "must not be empty" : "";
}

std::string checkParameter(const std::string& text) {
    Json::Value ignored(Json::objectValue);
    return readParameter(text, ignored);
}

std::vector<std::string> actionNames() {
    std::vector<std::string> names;
    for (const Job::Action action : ACTIONS) {
        names.push_back(action2str(action));
    }
    return names;
}

/** Ids are decimal: CLI11 would read 010 as 8. */
int toJobId(const std::string& text) {
    return std::stoi(text);
}

std::vector<int> toJobIds(const std::vector<std::string>& texts) {
    std::vector<int> jobIds(texts.size());
    std::transform(texts.begin(), texts.end(), jobIds.begin(), toJobId);
    return jobIds;
}

void addJobIds(CLI::App& verb, std::vector<std::string>& texts) {
    verb.add_option("ID", texts, "job ids")->option_text("...")->required()->check(checkJobId);
}

/** A verb of the tool, or of "session" and the like. */
struct VerbDefinition {
    const char* name;
    const char* description;
    void (*define)(CLI::App& verb, Options& options);
};

void addVerb(CLI::App& app, const VerbDefinition& definition, Options& options) {
    CLI::App* verb = app.add_subcommand(definition.name, definition.description);
    verb->group("Verbs");
    verb->footer(MORE);
    verb->get_help_ptr()->description("print this help and exit");
    definition.define(*verb, options);
}

/** What the help of the verb has to say at its end. */
void explain(CLI::App& verb, const std::string& details) {
    verb.footer(details + "\n" + MORE);
}

void defineGlobals(CLI::App& app, Globals& globals) {
    app.fallthrough();
    app.require_subcommand(1);
    app.footer(EXIT_STATUSES);
    app.get_formatter()->label("SUBCOMMAND", "VERB");
    app.get_help_ptr()->description("print this help and exit");
    app.set_version_flag("--version", "marubackupctl " MARUBACKUP_VERSION, "print the version and exit");
    app.add_flag("--json", globals.json, "write data as one line of JSON; a failure as {\"code\":…,\"reason\":…}");
    app.add_option("--timeout", globals.timeout,
                   "the longest that one exchange with the daemon, or a file system, may take")
        ->option_text("SECONDS (10)")
        ->check(checkTimeout);
}

void defineAdd(CLI::App& verb, Options& options) {
    explain(verb, "ACTION is one of " + joined(actionNames(), ", ") + ".");
    const auto add = std::make_shared<AddVerb>();
    verb.add_option("BACKEND", add->backend, "the backend that does the work (\"marubackupctl backends\")")
        ->option_text(" ")
        ->required()
        ->check(checkNotEmpty);
    verb.add_option("ACTION", add->action, "what it does")
        ->option_text(" ")
        ->required()
        ->check(CLI::IsMember(actionNames()));
    verb.add_option("--branch", add->branch, "run the backend's command_BRANCH, not its command_launch")
        ->option_text("BRANCH");
    const auto parameters = std::make_shared<std::vector<std::string>>();
    verb.add_option("-p,--param", *parameters, "a parameter of the job, a text or any JSON value; may be repeated")
        ->option_text("NAME=TEXT | NAME:=JSON")
        ->allow_extra_args(false)
        ->check(checkParameter);
    verb.callback([&options, add, parameters] {
        for (const std::string& parameter : *parameters) {
            readParameter(parameter, add->parameters);
        }
        options.verb = *add;
    });
}

void defineList(CLI::App& verb, Options& options) {
    const auto list = std::make_shared<ListVerb>();
    verb.add_option("--action", list->action, "only those of this action")
        ->option_text("ACTION")
        ->check(CLI::IsMember(actionNames()));
    verb.add_option("--backend", list->backend, "only those of this backend")
        ->option_text("BACKEND")
        ->check(checkNotEmpty);
    verb.add_option("--unique", list->unique, "only the one with this unique string")
        ->option_text("TEXT")
        ->check(checkNotEmpty);
    CLI::Option* format = verb.add_option("--format", list->format,
                                          "only those for which this template, such as "
                                          "{{BACKEND}} or a parameter's {{name}}, …")
                              ->option_text("TEMPLATE")
                              ->check(checkNotEmpty);
    CLI::Option* target =
        verb.add_option("--target", list->target, "… expands to this text")->option_text("TEXT")->check(checkNotEmpty);
    format->needs(target);
    target->needs(format);
    verb.callback([&options, list] { options.verb = *list; });
}

void defineShow(CLI::App& verb, Options& options) {
    const auto text = std::make_shared<std::string>();
    verb.add_option("ID", *text, "the job's id")->option_text(" ")->required()->check(checkJobId);
    verb.callback([&options, text] { options.verb = ShowVerb{toJobId(*text)}; });
}

void defineRemove(CLI::App& verb, Options& options) {
    explain(verb, "A waiting job is gone at once. A running one is sent SIGTERM, and is listed as stopping\n"
                  "until its process has ended. Of several failures the worst gives the exit status.");
    const auto texts = std::make_shared<std::vector<std::string>>();
    addJobIds(verb, *texts);
    verb.callback([&options, texts] { options.verb = RemoveVerb{toJobIds(*texts)}; });
}

void defineWait(CLI::App& verb, Options& options) {
    explain(verb, "A job that the daemon does not know counts as ended: a short one may be gone before the\n"
                  "wait begins. Whether it did its work is in the files that its backend writes.");
    const auto longest = std::make_shared<std::optional<double>>();
    verb.add_option("--for", *longest, "the longest that the whole wait may take, then exit status 124")
        ->option_text("SECONDS")
        ->check(checkSeconds);
    const auto texts = std::make_shared<std::vector<std::string>>();
    addJobIds(verb, *texts);
    verb.callback([&options, texts, longest] { options.verb = WaitVerb{toJobIds(*texts), *longest}; });
}

void defineBackends(CLI::App& verb, Options& options) {
    explain(verb, "These are the files in /usr/maru/share/marubackup, each hidden by one of the same name in\n"
                  "/usr/local/share/marubackup. DELEGATE names the actions for which one is a delegate.");
    verb.callback([&options] { options.verb = BackendsVerb(); });
}

void defineStatus(CLI::App& verb, Options& options) {
    explain(verb, "A daemon that cannot be reached counts as one without jobs, as it does for applications.");
    const auto status = std::make_shared<StatusVerb>();
    verb.add_option("--backend", status->backend, "whether this one is at work, not any")
        ->option_text("BACKEND")
        ->check(checkNotEmpty);
    verb.callback([&options, status] { options.verb = *status; });
}

/** The lifetime is read as a text, since CLI11 takes 010 for 8. */
CLI::Option* addLifetime(CLI::App& verb, std::string& text, const std::string& description) {
    return verb.add_option("--lifetime", text, description)->option_text("SECONDS")->check(checkLifetime);
}

void addSessionId(CLI::App& verb, std::string& id) {
    verb.add_option("ID", id, "the session's id")->option_text(" ")->required()->check(checkNotEmpty);
}

void defineSessionCreate(CLI::App& verb, Options& options) {
    explain(verb, "The daemon removes it when it has not been used for its lifetime.");
    const auto create = std::make_shared<SessionCreateVerb>();
    const auto lifetime = std::make_shared<std::string>();
    addLifetime(verb, *lifetime, "how long it lasts unused; 259200, three days, at most")->required();
    verb.add_flag("--max-volume", create->onMaxVolume, "on the volume with the most free space");
    verb.callback([&options, create, lifetime] {
        create->lifetime = std::stol(*lifetime);
        options.verb = *create;
    });
}

void defineSessionPath(CLI::App& verb, Options& options) {
    const auto path = std::make_shared<SessionPathVerb>();
    addSessionId(verb, path->id);
    verb.callback([&options, path] { options.verb = *path; });
}

void defineSessionDestroy(CLI::App& verb, Options& options) {
    const auto destroy = std::make_shared<SessionDestroyVerb>();
    addSessionId(verb, destroy->id);
    verb.callback([&options, destroy] { options.verb = *destroy; });
}

void defineSessionExpire(CLI::App& verb, Options& options) {
    explain(verb, "It has expired when its directory was not changed, and no file in it read, for its\n"
                  "lifetime. Prints the seconds that are left; 0 if it is gone.");
    const auto expire = std::make_shared<SessionExpireVerb>();
    const auto lifetime = std::make_shared<std::string>();
    const auto ignoreFiles = std::make_shared<bool>(false);
    addSessionId(verb, expire->id);
    addLifetime(verb, *lifetime, "how long it lasts unused")->required();
    verb.add_flag("--ignore-files", *ignoreFiles, "that a file was read does not count");
    verb.callback([&options, expire, lifetime, ignoreFiles] {
        expire->lifetime = std::stol(*lifetime);
        expire->walkFiles = !*ignoreFiles;
        options.verb = *expire;
    });
}

const std::array<VerbDefinition, 4> SESSION_VERBS = {{
    {"create", "make a session, and print its id", defineSessionCreate},
    {"path", "print the directory of a session", defineSessionPath},
    {"destroy", "remove a session with all that is in it", defineSessionDestroy},
    {"expire", "remove a session that has expired, or print how long it has left", defineSessionExpire},
}};

void defineSession(CLI::App& verb, Options& options) {
    verb.require_subcommand(1);
    for (const VerbDefinition& definition : SESSION_VERBS) {
        addVerb(verb, definition, options);
    }
}

template <typename Verb>
void definePathVerb(CLI::App& verb, Options& options) {
    const auto chosen = std::make_shared<Verb>();
    verb.add_option("PATH", chosen->path, "a file or folder")->option_text(" ")->required()->check(checkNotEmpty);
    verb.callback([&options, chosen] { options.verb = *chosen; });
}

void defineArchiveVersionGet(CLI::App& verb, Options& options) {
    explain(verb, "One that has none is at 0. A link is looked at itself.");
    definePathVerb<ArchiveVersionGetVerb>(verb, options);
}

void defineArchiveVersionFsIncrease(CLI::App& verb, Options& options) {
    explain(verb, "If it is increased and then cannot be read, that is a failure too: look with fs-get.");
    definePathVerb<ArchiveVersionFsIncreaseVerb>(verb, options);
}

const std::array<VerbDefinition, 3> ARCHIVE_VERSION_VERBS = {{
    {"get", "print the archive version of a file or folder", defineArchiveVersionGet},
    {"fs-get", "print the archive version of the file system that PATH is on", definePathVerb<ArchiveVersionFsGetVerb>},
    {"fs-increase", "increase the archive version of the file system, and print the new one",
     defineArchiveVersionFsIncrease},
}};

void defineArchiveVersion(CLI::App& verb, Options& options) {
    explain(verb, "Where a version differs from the one that was noted down with the last archive, there\n"
                  "is something to archive again.");
    verb.require_subcommand(1);
    for (const VerbDefinition& definition : ARCHIVE_VERSION_VERBS) {
        addVerb(verb, definition, options);
    }
}

const std::array<VerbDefinition, 9> VERBS = {{
    {"add", "put a job into the queue, and print its id", defineAdd},
    {"list", "list the jobs that wait or run", defineList},
    {"show", "show one job with its parameters", defineShow},
    {"remove", "remove jobs, running ones too", defineRemove},
    {"wait", "wait until jobs have ended", defineWait},
    {"backends", "list the installed backends and what they can do", defineBackends},
    {"status", "tell what may start now, and what is at work", defineStatus},
    {"session", "make, find and remove session directories", defineSession},
    {"archive-version", "read or increase archive versions of files and file systems", defineArchiveVersion},
}};

bool lacksVerb(const CLI::App& app) {
    const std::vector<CLI::App*> chosen = app.get_subcommands();
    return chosen.empty() ? app.get_require_subcommand_min() > 0 : lacksVerb(*chosen.front());
}

void define(CLI::App& app, Options& options, const std::function<bool(const VerbDefinition&)>& isWanted) {
    app.description("Asks the backup queue daemon, marubackupd, to do jobs, and about them.\n"
                    "Data goes to standard output, everything else to standard error.");
    defineGlobals(app, options.globals);
    for (const VerbDefinition& definition : VERBS) {
        if (isWanted(definition)) {
            addVerb(app, definition, options);
        }
    }
}

/** Tells the user what is asked for, or wrong. The result is the exit status. */
int tell(const CLI::App& app, const CLI::ParseError& end) {
    std::ostringstream out;
    std::ostringstream err;
    if (app.exit(end, out, err) == 0) {
        putData(out.str());
        return EXIT_DONE;
    }
    const bool noVerb = end.get_exit_code() == static_cast<int>(CLI::ExitCodes::RequiredError) && lacksVerb(app);
    say((noVerb ? "a verb is missing, or is none of those that there are" : end.what()) + HINT);
    return EXIT_USAGE;
}

} // namespace

std::optional<int> readOptions(int argc, char** argv, Options& options) {
    // Scripts start this tool once for each job, and all verbs with their options take longer to
    // define than a job to add. One that is no word of the line is not asked for.
    CLI::App named;
    define(named, options, [argc, argv](const VerbDefinition& verb) {
        return std::find(argv, argv + argc, std::string_view(verb.name)) != argv + argc;
    });
    try {
        named.parse(argc, argv);
        return std::nullopt;
    } catch (const CLI::ParseError&) {
    }

    // Help, and what is said of a mistake, may be about any.
    CLI::App all;
    define(all, options, [](const VerbDefinition&) { return true; });
    try {
        all.parse(argc, argv);
        return std::nullopt;
    } catch (const CLI::ParseError& end) {
        return tell(all, end);
    }
}
