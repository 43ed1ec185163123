#include <gtest/gtest.h>

#include "platform/system.h"

namespace {

[[gnu::noinline]] size_t AvailableBelowABigFrame() {
  volatile char big[8192];
  big[0] = 1;
  size_t available = SysStackAvail();
  return available + big[0] - 1;
}

// The stream refuses to recurse on what this reports.
TEST(HostStackTest, ReportsRoomBelowTheCaller) {
  size_t here = SysStackAvail();
  EXPECT_GT(here, 4224u);
  EXPECT_LE(AvailableBelowABigFrame() + 8192, here);
}

}  // namespace
