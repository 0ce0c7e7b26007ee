#include <gtest/gtest.h>

#include "tests/support/host_fixture.h"

namespace {

class EntryPointsTest : public testsupport::ModuleHostTest {};

TEST_F(EntryPointsTest, StartsAndStops) {
  StartHost();
  host().Stop();
}

}  // namespace
