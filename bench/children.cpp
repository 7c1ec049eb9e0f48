#include "children.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <stdexcept>
#include <system_error>

namespace bench {

namespace {

/** Standard output goes to /dev/null. */
class Silence {
public:
    Silence() {
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    }
    ~Silence() {
        posix_spawn_file_actions_destroy(&actions);
    }
    Silence(const Silence&) = delete;
    Silence& operator=(const Silence&) = delete;

    const posix_spawn_file_actions_t* get() const {
        return &actions;
    }

private:
    posix_spawn_file_actions_t actions;
};

} // namespace

pid_t start(const std::vector<std::string>& command) {
    static const Silence silence;
    std::vector<char*> words;
    for (const std::string& word : command) {
        words.push_back(const_cast<char*>(word.c_str()));
    }
    words.push_back(nullptr);
    pid_t child = -1;
    const int error = posix_spawnp(&child, words[0], silence.get(), nullptr, words.data(), environ);
    if (error != 0) {
        throw std::system_error(error, std::generic_category(), command.at(0));
    }
    return child;
}

pid_t await(pid_t child) {
    int status = 0;
    const pid_t ended = waitpid(child, &status, 0);
    if (ended < 0 || status != 0) {
        throw std::runtime_error("a program failed, wait status " + std::to_string(status));
    }
    return ended;
}

} // namespace bench
