/* archive_calls FUNCTION PATH: an application in C. Prints what the function returns, and the version. */

#include <stdio.h>
#include <string.h>

#include <marubackup/maru_archive_version.h>

int main(int argc, char** argv) {
    unsigned int version = 4711;
    int result = 1;
    if (argc != 3) {
        return 2;
    }
    if (strcmp(argv[1], "get") == 0) {
        result = MARUBackupArchVerGet(argv[2], &version);
    } else if (strcmp(argv[1], "fs-get") == 0) {
        result = MARUBackupFSArchVerGet(argv[2], &version);
    } else if (strcmp(argv[1], "fs-increase") == 0) {
        result = MARUBackupFSArchVerIncrease(argv[2], &version);
    } else if (strcmp(argv[1], "set") == 0) {
        result = MARUBackupFileArchVerSet(argv[2], version);
    }
    printf("%d %u\n", result, version);
    return 0;
}
