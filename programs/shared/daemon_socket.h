#pragma once

/** Where the daemon serves. */
#define MARUBACKUP_SOCKET "/var/run/marubackupd.socket"

/**
 * Whether somebody serves the daemon's socket: false if there is none, or one
 * whose server has ended. A server that is too busy to be connected to, or that
 * we may not use, is there. Never blocks, and may be called from a signal
 * handler.
 */
bool isDaemonThere();
