#include <marubackup-util/process.h>

#include <signal.h>

#include <cerrno>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>

namespace MARU {
namespace Backup {

namespace {

/** The fields of /proc/<pid>/stat behind the program's name; empty if there is no such process. */
std::string statFields(int pid) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
    const std::string stat((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    // The name is in parentheses and may itself hold any character.
    const std::size_t nameEnd = stat.rfind(')');
    return nameEnd == std::string::npos ? std::string() : stat.substr(nameEnd + 1);
}

} // namespace

bool Process::isAlive(int pid) {
    return pid > 0 && (kill(pid, 0) == 0 || errno == EPERM);
}

bool Process::isZombie(int pid) {
    if (pid <= 0) {
        return false;
    }
    std::istringstream fields(statFields(pid));
    char state = 0;
    fields >> state;
    std::string skipped;
    for (int field = 4; field < 20; ++field) {
        fields >> skipped;
    }
    long threads = 0;
    fields >> threads;
    // A process whose first thread has ended looks like a zombie, but runs on
    // as long as another thread does.
    return state == 'Z' && threads <= 1;
}

} // namespace Backup
} // namespace MARU
