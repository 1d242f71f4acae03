#include "simulation/seeds.h"

#include <gtest/gtest.h>

int main(int argc, char** argv)
{
    typhon::simulation::readSeedOptions(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
