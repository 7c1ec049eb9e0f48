#pragma once

/**
 * Gives the calling process, the first of a mount and a PID namespace, its own
 * /run, /dev, /proc and product folders below /usr; all else stays the host's.
 * The working folder is kept. Throws SetupError or std::filesystem::filesystem_error.
 */
void makePrivateView();
