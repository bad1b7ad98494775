// SPDX-License-Identifier: Apache-2.0
/// What the tests of workers share.
#pragma once

#include "tests/containment/raw_client.h"

#include <gtest/gtest.h>

namespace Keelgate::Test {

/// A service that is ready; workers that must go on answering afterwards.
class Worker : public testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(service_.ready()) << service_.refusal(); }
  void TearDown() override {
    if (HasFatalFailure() || IsSkipped()) return;
    EXPECT_EQ(resultOf(service_.obey("answer").first), 0);
  }

  RawClient service_{OBEDIENT_SERVICE};
};

}  // namespace Keelgate::Test
