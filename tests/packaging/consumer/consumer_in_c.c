#include <stdio.h>

#include <marubackup/maru_archive_version.h>

int main(void) {
    unsigned int version = 1;
    const int result = MARUBackupArchVerGet("/", &version);
    printf("%d %u\n", result, version);
    return 0;
}
