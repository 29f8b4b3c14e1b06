// SPDX-License-Identifier: Apache-2.0
#include "punctuator.h"

#include <gtest/gtest.h>

#include "punctuator_double.h"

namespace vorta {
namespace speech {
namespace {

using punctuator_double::Reply;

class PunctuatorTest : public testing::Test {
 protected:
  void SetUp() override {
    punctuator_double::Reset();
    ASSERT_TRUE(punctuator_.Init());
  }

  Punctuator punctuator_{"m", "v", "p", "n", "c", "x", "b", "en", false};
};

TEST_F(PunctuatorTest, InitPassesTheEightStringsInOrderAndBothEndsHappenOnce) {
  EXPECT_FALSE(punctuator_.Init());
  ASSERT_EQ(punctuator_double::Count("punctuator_init"), 1);
  EXPECT_EQ(punctuator_double::Calls()[0].strings,
            (std::vector<std::string>{"m", "v", "p", "n", "c", "x", "b", "en"}));
  punctuator_.Release();
  EXPECT_EQ(punctuator_.Punctuate("abc", true), "");
  punctuator_.Release();
  EXPECT_EQ(punctuator_double::Count("punctuator_relese"), 1);
  EXPECT_EQ(punctuator_double::LiveHandles(), 0);
}

TEST_F(PunctuatorTest, BufferTooSmallIsRetriedOnceWithTheRequestedSize) {
  const std::string long_text(9999, 'a');
  EXPECT_EQ(punctuator_.Punctuate(long_text, true), long_text + ".");
  const auto& calls = punctuator_double::Calls();
  ASSERT_EQ(punctuator_double::Count("punctuator_do_it"), 2);
  EXPECT_EQ(calls[calls.size() - 2].size_in, 4096);
  EXPECT_EQ(calls.back().size_in, 10000);

  punctuator_double::QueueReply(Reply{1, 5000, ""});
  punctuator_double::QueueReply(Reply{1, 6000, ""});
  EXPECT_EQ(punctuator_.Punctuate("x", true), "");  // no third attempt
  EXPECT_EQ(punctuator_double::Count("punctuator_do_it"), 4);
}

TEST_F(PunctuatorTest, FailuresAndImplausibleSizesGiveEmptyText) {
  const Reply replies[] = {
      {2, 3, "abc"}, {0, 5000, "abc"},                       // claims more than the buffer
      {0, -1, ""},   {1, -5, ""},      {1, 0x7FFFFFFF, ""},  // would need 2 GiB
      {0, 0, ""},                                            // an empty answer is empty
  };
  for (const Reply& reply : replies) {
    SCOPED_TRACE(reply.size);
    const int calls = punctuator_double::Count("punctuator_do_it");
    punctuator_double::QueueReply(reply);
    EXPECT_EQ(punctuator_.Punctuate("abc", true), "");
    EXPECT_EQ(punctuator_double::Count("punctuator_do_it"), calls + 1);
  }
}

}  // namespace
}  // namespace speech
}  // namespace vorta
