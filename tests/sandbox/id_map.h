#pragma once

#include <sys/types.h>

/** The ids that an ordinary user may hand out in a user namespace. */
struct IdRange {
    unsigned long first;
    unsigned long count;
};

struct IdRanges {
    IdRange users;
    IdRange groups;
};

/**
 * What /etc/subuid and /etc/subgid grant the caller. Throws SetupError, with the
 * remedy, if that is nothing or too little for the system's own accounts.
 */
IdRanges grantedIds();

/**
 * Fills the maps of the user namespace of `process`, a child of the caller's:
 * the caller is root inside, so that its files are root's there, and the ids
 * from 1 on are the granted ones. Throws SetupError.
 */
void mapIds(pid_t process, const IdRanges& granted);
