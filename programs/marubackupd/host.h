#pragma once

// What the daemon needs from the host that it runs on, or has to say about it.

/**
 * Has all signals delivered, whatever mask the process was started with. With
 * one that blocks them the daemon could not be told to end, and would notice the
 * end of a job by its two-second look only.
 */
void unblockSignals();

/**
 * Raises the soft limit on descriptors so far that an overload of connections
 * meets the server's own limit, which closes the connection, and not a failing
 * accept, which leaves it waiting and is tried again without end.
 */
void raiseDescriptorLimit();

/**
 * Warns if the group that may use the socket is not one of administrators: its
 * members can have programs run as root.
 */
void warnOfSocketGroup();
