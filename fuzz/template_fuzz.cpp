// Any template, with any text as a parameter's value, expands; a value is never
// expanded itself.

#include <cstdint>
#include <cstdlib>
#include <string>

#include <json/value.h>

#include <marubackup/job.h>

using namespace MARU::Backup;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string text(reinterpret_cast<const char*>(data), size);
    Job job("backend", Job::ACTION_BACKUP);
    job.setParam("value", text);
    job.toFormatString(text);
    if (job.toFormatString("<{{value}}>") != "<" + text + ">") {
        std::abort();
    }
    return 0;
}
