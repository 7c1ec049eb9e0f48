#include "report.h"

#include <syslog.h>

#include <cstdio>

void report(int priority, const std::string& text) {
    std::fprintf(stderr, "marubackupd: %s\n", text.c_str());
    syslog(priority, "%s", text.c_str());
}
