#include <marubackup-util/mustache.h>

namespace MARU {
namespace Backup {

std::string replaceMustache(const std::string& text, boost::function<bool(const std::string&, std::string&)> mapper) {
    std::string result;
    std::size_t copied = 0; // what stands before it is in `result`
    std::size_t opening = std::string::npos;
    for (std::size_t at = 0; at + 1 < text.size(); ++at) {
        if (text[at] == '{' && text[at + 1] == '{') {
            opening = at;
        } else if (text[at] == '}' && text[at + 1] == '}' && opening != std::string::npos) {
            std::string value;
            if (mapper(text.substr(opening + 2, at - opening - 2), value)) {
                result.append(text, copied, opening - copied).append(value);
                copied = at + 2;
            }
            opening = std::string::npos;
        }
    }
    return result.append(text, copied, std::string::npos);
}

} // namespace Backup
} // namespace MARU
