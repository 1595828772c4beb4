// What tests on the stand-in for the platform begin and end with.
#pragma once

#include <gtest/gtest.h>

#include "platform.h"

namespace platform {

// A test that begins with a reset, and in the end has freed and wiped all that it allocated.
class fixture : public testing::Test {
 protected:
  fixture() { reset(); }
  ~fixture() override {
    EXPECT_EQ(live_blocks, 0u);
    EXPECT_EQ(unwiped_blocks, 0u);
  }
};

}  // namespace platform
