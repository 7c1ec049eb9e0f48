#include "process_state.h"

#include <sys/syscall.h>

#include <algorithm>
#include <sstream>
#include <string>

#include "support/emulation.h"
#include "support/files.h"
#include "support/waiting.h"

namespace {

/** The state's letter, which is 'R' also while a process is being woken. */
char stateOf(pid_t pid) {
    const std::string stat = support::readFile("/proc/" + std::to_string(pid) + "/stat");
    return stat.at(stat.rfind(')') + 2);
}

/**
 * Our number of a system call that the kernel shows as `number`. An emulated
 * program's calls are made by the emulator, and have the host's numbers: those of
 * x86-64, of the calls that tests wait for.
 */
long ownNumber(long number) {
    if (!support::isEmulated()) {
        return number;
    }
    switch (number) {
    case 44:
        return SYS_sendto;
    case 45:
        return SYS_recvfrom;
    case 281:
        return SYS_epoll_pwait;
    default:
        return -1;
    }
}

} // namespace

BlockedCall blockedCall(pid_t pid) {
    BlockedCall call;
    if (stateOf(pid) != 'S') {
        return call;
    }
    std::istringstream fields(support::readFile("/proc/" + std::to_string(pid) + "/syscall"));
    std::string descriptor;
    std::string buffer;
    std::string size;
    if (!(fields >> call.number >> descriptor >> buffer >> size)) {
        return BlockedCall();
    }
    call.number = ownNumber(call.number);
    call.size = std::stoul(size, nullptr, 16);
    return call;
}

bool waitUntilBlockedIn(pid_t pid, const std::vector<long>& numbers) {
    return support::waitUntil([pid, &numbers]() {
        return std::find(numbers.begin(), numbers.end(), blockedCall(pid).number) != numbers.end();
    });
}

bool waitUntilLoopSleeps(pid_t pid) {
    return waitUntilBlockedIn(pid, {
#ifdef SYS_epoll_wait
                                       SYS_epoll_wait,
#endif
#ifdef SYS_epoll_pwait2
                                       SYS_epoll_pwait2,
#endif
                                       SYS_epoll_pwait});
}

long timesSlept(pid_t pid) {
    const std::string status = support::readFile("/proc/" + std::to_string(pid) + "/status");
    const std::string field = "\nvoluntary_ctxt_switches:";
    return std::stol(status.substr(status.find(field) + field.size()));
}
