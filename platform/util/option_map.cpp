#include <marubackup-util/option_map.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <map>
#include <string_view>
#include <system_error>

namespace MARU {
namespace Backup {

namespace {

using Options = std::map<std::string, std::string>;

constexpr std::string_view BLANKS = " \t";
constexpr std::string_view LINE_END_BLANKS = " \t\r";
const std::size_t MAX_FILE_SIZE = 16 * 1024 * 1024;
const std::size_t READ_MORE = 16 * 1024;

/**
 * Reads what `fd` holds; false if it cannot be read or is too large for a
 * configuration. A file of the `expected` size takes one read.
 */
bool readAll(int fd, std::size_t expected, std::string& content) {
    std::size_t size = 0;
    content.resize(std::min(expected, MAX_FILE_SIZE) + 1);
    while (size <= MAX_FILE_SIZE) {
        if (size == content.size()) {
            content.resize(size + READ_MORE);
        }
        const ssize_t got = read(fd, &content[size], content.size() - size);
        if (got < 0) {
            if (errno != EINTR) {
                return false;
            }
            continue;
        }
        size += static_cast<std::size_t>(got);
        // There was room for more, so that much is all.
        if (got == 0 || size == expected) {
            content.resize(size);
            return true;
        }
    }
    return false;
}

/** Reads a regular file; anything else, like a FIFO that nobody writes to, could block for ever. */
bool readRegularFile(const std::string& path, std::string& content) {
    if (path.find('\0') != std::string::npos) {
        return false;
    }
    const int fd = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
    if (fd < 0) {
        return false;
    }
    struct stat info = {};
    const bool done =
        fstat(fd, &info) == 0 && S_ISREG(info.st_mode) && readAll(fd, static_cast<std::size_t>(info.st_size), content);
    close(fd);
    return done;
}

/** `text` without the blanks before it and those of `endBlanks` behind it. */
std::string_view trimmed(std::string_view text, std::string_view endBlanks) {
    const std::size_t end = text.find_last_not_of(endBlanks) + 1; // 0 if there is nothing else
    const std::size_t start = std::min(text.find_first_not_of(BLANKS), end);
    return text.substr(start, end - start);
}

/** Reads a file's lines and keeps the options of one section. */
class SectionReader {
public:
    explicit SectionReader(std::string_view section) : wanted(section) {
    }

    /** False if `text`, one line without its line end, is malformed. */
    bool addLine(std::string_view text) {
        const std::string_view line = trimmed(text, LINE_END_BLANKS);
        if (line.empty() || line[0] == '#' || line[0] == ';') {
            return true;
        }
        return line[0] == '[' ? addSection(line) : addOption(line);
    }

    bool found = false;
    Options options;

private:
    bool addSection(std::string_view line) {
        if (line.find(']') != line.size() - 1) {
            return false;
        }
        const std::string_view name = trimmed(line.substr(1, line.size() - 2), BLANKS);
        inside = name == wanted;
        found = found || inside;
        return !name.empty();
    }

    bool addOption(std::string_view line) {
        const std::size_t equals = line.find('=');
        if (equals == std::string::npos || equals == 0) {
            return false;
        }
        if (inside) {
            options[std::string(trimmed(line.substr(0, equals), BLANKS))] = trimmed(line.substr(equals + 1), BLANKS);
        }
        return true;
    }

    const std::string_view wanted;
    bool inside = false;
};

/** Splits a value into its words, one call of next() for each. */
class WordSplitter {
public:
    explicit WordSplitter(const std::string& value) : text(value) {
    }

    /** Whether there is another word. */
    bool more() {
        while (at < text.size() && isBlank(text[at])) {
            ++at;
        }
        return at < text.size();
    }

    /** Reads it. False if a quote is not closed, or a backslash quotes nothing. */
    bool next(std::string& word) {
        while (at < text.size() && !isBlank(text[at])) {
            const char c = text[at++];
            if (c == '\'' || c == '"') {
                if (!readQuoted(c, word)) {
                    return false;
                }
            } else if (c != '\\') {
                word += c;
            } else if (at < text.size()) {
                word += text[at++];
            } else {
                return false;
            }
        }
        return true;
    }

private:
    static bool isBlank(char c) {
        return c == ' ' || c == '\t';
    }

    /** Reads up to and over the closing `quote`; false if there is none. */
    bool readQuoted(char quote, std::string& word) {
        while (at < text.size()) {
            const char c = text[at++];
            if (c == quote) {
                return true;
            }
            const bool escapes = quote == '"' && c == '\\' && at < text.size();
            word += escapes && (text[at] == '"' || text[at] == '\\') ? text[at++] : c;
        }
        return false;
    }

    const std::string& text;
    std::size_t at = 0;
};

} // namespace

class OptionMapPrivate {
public:
    const std::string* find(const std::string& key) const {
        const Options::const_iterator option = options.find(key);
        return option == options.end() ? nullptr : &option->second;
    }

    Options options;
};

OptionMap::OptionMap() : d(new OptionMapPrivate) {
}

OptionMap::~OptionMap() {
    delete d;
}

bool OptionMap::optSectionLoad(const std::string& path, const std::string& section, int /*reserved*/) {
    optClear();
    std::string content;
    if (!readRegularFile(path, content)) {
        return false;
    }
    SectionReader reader(section);
    const std::string_view text = content;
    for (std::size_t start = 0; start < text.size();) {
        const std::size_t end = std::min(text.find('\n', start), text.size());
        if (!reader.addLine(text.substr(start, end - start))) {
            return false;
        }
        start = end + 1;
    }
    d->options.swap(reader.options);
    return reader.found;
}

void OptionMap::optClear() {
    d->options.clear();
}

bool OptionMap::optGet(const std::string& key, std::string& value, bool /*reserved*/) const {
    const std::string* text = d->find(key);
    if (!text) {
        return false;
    }
    value = *text;
    return true;
}

bool OptionMap::optGet(const std::string& key, std::list<std::string>& value) const {
    const std::string* text = d->find(key);
    if (!text) {
        return false;
    }
    std::list<std::string> words;
    for (WordSplitter splitter(*text); splitter.more();) {
        words.emplace_back();
        if (!splitter.next(words.back())) {
            return false;
        }
    }
    value.swap(words);
    return true;
}

bool OptionMap::optGet(const std::string& key, int& value) const {
    const std::string* text = d->find(key);
    if (!text) {
        return false;
    }
    const char* end = text->data() + text->size();
    const char* start = text->data();
    if (text->size() > 1 && start[0] == '+' && start[1] != '-') {
        ++start; // from_chars() knows only the minus
    }
    int number = 0;
    const std::from_chars_result result = std::from_chars(start, end, number);
    if (result.ec != std::errc() || result.ptr != end) {
        return false;
    }
    value = number;
    return true;
}

} // namespace Backup
} // namespace MARU
