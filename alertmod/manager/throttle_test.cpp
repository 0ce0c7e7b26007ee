#include "alertmod/manager/throttle.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <vector>

namespace hx {
namespace {

struct Step {
  int32_t throttleSeconds;
  uint32_t tickMs;
  bool admitted;
};

struct Case {
  const char* name;
  std::vector<Step> steps;
};

TEST(ThrottleTableTest, AdmitsOncePerIntervalOnTheWrappingTick) {
  const Case cases[] = {
      {"no throttle", {{0, 1000, true}, {0, 1000, true}, {0, 1001, true}}},
      {"59.9 s is too early, 60 s is not",
       {{60, 1000, true}, {60, 60900, false}, {60, 61000, true}, {60, 61001, false}}},
      {"a rejected request does not move the last time",
       {{60, 1000, true}, {60, 30000, false}, {60, 60999, false}, {60, 61000, true}}},
      {"a changed ThrottleSeconds starts afresh",
       {{60, 1000, true}, {30, 2000, true}, {30, 31999, false}, {60, 32000, true}}},
      {"across the wrap of the tick",
       {{60, 0xFFFFF000u, true}, {60, 0x0000C000u, false}, {60, 0x0000E000u, true}}},
      {"more than 24.8 days later counts as long ago",
       {{60, 1000, true}, {60, 1000 + 0x80000000u, true}, {60, 2000 + 0x80000000u, false}}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    ThrottleTable table;
    for (size_t i = 0; i < c.steps.size(); ++i) {
      const Step& step = c.steps[i];
      EXPECT_EQ(table.Admit(7, step.throttleSeconds, step.tickMs), step.admitted) << "step " << i;
    }
  }
}

TEST(ThrottleTableTest, ProfilesAreThrottledApart) {
  ThrottleTable table;
  EXPECT_TRUE(table.Admit(1, 60, 1000));
  EXPECT_TRUE(table.Admit(2, 60, 1001));
  EXPECT_FALSE(table.Admit(1, 60, 2000));
  EXPECT_EQ(table.Entries().at(2).lastAcceptedMs, 1001u);
}

}  // namespace
}  // namespace hx
