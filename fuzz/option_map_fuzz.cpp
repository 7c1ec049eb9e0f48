// Any file loads or is refused, and every kind of reading of every value ends.

#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <list>
#include <string>

#include <marubackup-util/option_map.h>

using namespace MARU::Backup;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const int file = memfd_create("fuzz", 0);
    static const std::string path = "/proc/self/fd/" + std::to_string(file);
    if (ftruncate(file, 0) != 0 || pwrite(file, data, size, 0) != static_cast<ssize_t>(size)) {
        std::abort();
    }
    OptionMap options;
    if (options.optSectionLoad(path, "backup", -1)) {
        std::string text;
        std::list<std::string> words;
        int number = 0;
        options.optGet("command_launch", text, false);
        options.optGet("command_launch", words);
        options.optGet("priority", number);
    }
    return 0;
}
