#pragma once

#include <string>
#include <vector>

/**
 * Catches what this process and its children write to standard error while the
 * object lives: the daemon's diary. A line is there as soon as the call that
 * writes it has returned.
 */
class Diary {
public:
    Diary();
    ~Diary();
    Diary(const Diary&) = delete;
    Diary& operator=(const Diary&) = delete;

    /** The lines since the last call. */
    std::vector<std::string> take();

private:
    int terminal;
    int file;
    long taken = 0;
};
