// Test entry: EFL is initialised once (headless under ELM_ENGINE=buffer) for every test
// program, so tests that build objects and those that only spin the main loop share it.
#include <Elementary.h>
#include <gtest/gtest.h>

int main(int argc, char **argv)
{
    ::testing::InitGoogleTest(&argc, argv);
    elm_init(argc, argv);
    int rc = RUN_ALL_TESTS();
    elm_shutdown();
    return rc;
}
