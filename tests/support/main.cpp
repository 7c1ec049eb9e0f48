#include <cstdio>
#include <cstdlib>

#include <gtest/gtest.h>

namespace {

/** Tests write to the daemon's fixed paths, which are only safe to touch in the sandbox. */
const int EXIT_SKIPPED = 77;

} // namespace

int main(int argc, char** argv) {
    testing::InitGoogleTest(&argc, argv);
    if (!testing::GTEST_FLAG(list_tests) && std::getenv("MARUBACKUP_SANDBOX") == nullptr) {
        std::fprintf(stderr, "skipped: run it inside the sandbox: scripts/sandbox %s\n", argv[0]);
        return EXIT_SKIPPED;
    }
    return RUN_ALL_TESTS();
}
