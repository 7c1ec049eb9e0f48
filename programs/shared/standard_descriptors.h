#pragma once

/**
 * Opens those of the descriptors 0, 1 and 2 that are closed on /dev/null.
 * Otherwise a socket or a file of ours would get such a number, and what is
 * meant for the terminal would be written into it.
 */
void openMissingStandardDescriptors();
