// Test entry: EFL is initialised once (headless under ELM_ENGINE=buffer) for every test
// program, so tests that build objects and those that only spin the main loop share it.
#include <Elementary.h>
#include <gtest/gtest.h>

int main(int argc, char **argv)
{
    ::testing::InitGoogleTest(&argc, argv);
    // Listing the tests (CTest does it to find them) needs no toolkit.
    if (::testing::GTEST_FLAG(list_tests))
        return RUN_ALL_TESTS();
    elm_init(argc, argv);
    int rc = RUN_ALL_TESTS();
    elm_shutdown();
    return rc;
}
