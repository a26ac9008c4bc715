// Runs the properties with a seed that is the same every time, unless RC_PARAMS says otherwise.
#include <gtest/gtest.h>

#include <cstdlib>

int main(int argc, char** argv) {
    setenv("RC_PARAMS", "seed=20261122 max_success=1000", 0);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
