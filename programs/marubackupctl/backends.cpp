#include <list>
#include <map>

#include <marubackup/backend_manager.h>

#include "output.h"
#include "table.h"
#include "verbs.h"
#include "words.h"

using MARU::Backup::BackendManager;

namespace {

/** What a backend can do: the names of actions. */
struct Abilities {
    std::vector<std::string> actions;
    /** Those of them for which it is a delegate. */
    std::vector<std::string> delegated;
};

Abilities abilitiesOf(const std::string& backend) {
    Abilities abilities;
    for (const Job::Action action : ACTIONS) {
        const std::string name = action2str(action);
        BackendManager manager;
        if (manager.load(backend, name)) {
            abilities.actions.push_back(name);
            if (manager.isDelegate()) {
                abilities.delegated.push_back(name);
            }
        }
    }
    return abilities;
}

Json::Value toArray(const std::vector<std::string>& names) {
    Json::Value array(Json::arrayValue);
    for (const std::string& name : names) {
        array.append(name);
    }
    return array;
}

std::string asTable(const std::map<std::string, Abilities>& backends) {
    Table table({"BACKEND", "ACTIONS", "DELEGATE"});
    for (const auto& [name, abilities] : backends) {
        table.add({name, joined(abilities.actions, ","), joined(abilities.delegated, ",")});
    }
    return table.text();
}

std::string asJson(const std::map<std::string, Abilities>& backends) {
    Json::Value array(Json::arrayValue);
    for (const auto& [name, abilities] : backends) {
        Json::Value backend(Json::objectValue);
        backend["backend"] = name;
        backend["actions"] = toArray(abilities.actions);
        backend["delegate"] = toArray(abilities.delegated);
        array.append(backend);
    }
    return toLine(array) + "\n";
}

} // namespace

int run(const BackendsVerb&, const Globals& globals) {
    std::list<std::string> names;
    if (!BackendManager::listBackend(names)) {
        say("cannot read /usr/maru/share/marubackup: ask as a user who may");
        return EXIT_OTHER;
    }
    std::map<std::string, Abilities> backends;
    for (const std::string& name : names) {
        backends[name] = abilitiesOf(name);
    }
    putData(globals.json ? asJson(backends) : asTable(backends));
    return EXIT_DONE;
}
