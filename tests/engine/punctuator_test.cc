#include "punctuator.h"

#include <gtest/gtest.h>

#include "punctuator_double.h"
#include "test_support.h"

namespace vorta {
namespace speech {
namespace {

using kvasr_test::Stdout;
using punctuator_double::Reply;

class PunctuatorTest : public testing::Test {
 protected:
  void SetUp() override { punctuator_double::Reset(); }

  static Punctuator Make(bool punc_all) {
    return Punctuator("m", "v", "p", "n", "c", "x", "b", "en", punc_all);
  }
};

TEST_F(PunctuatorTest, InitPassesTheEightStringsInOrderOnce) {
  Punctuator p = Make(false);
  ASSERT_TRUE(p.Init());
  EXPECT_FALSE(p.Init());
  ASSERT_EQ(punctuator_double::Count("punctuator_init"), 1);
  EXPECT_EQ(punctuator_double::Calls()[0].strings,
            (std::vector<std::string>{"m", "v", "p", "n", "c", "x", "b", "en"}));
}

TEST_F(PunctuatorTest, InitFailureIsLogged) {
  punctuator_double::SetInitFails(true);
  Punctuator p = Make(false);
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(p.Init()); }), "punctuator init failed\n");
}

TEST_F(PunctuatorTest, BufferTooSmallIsRetriedOnceWithTheRequestedSize) {
  Punctuator p = Make(false);
  ASSERT_TRUE(p.Init());
  const std::string long_text(9999, 'a');
  EXPECT_EQ(p.Punctuate(long_text, true), long_text + ".");
  const auto& calls = punctuator_double::Calls();
  ASSERT_EQ(punctuator_double::Count("punctuator_do_it"), 2);
  EXPECT_EQ(calls[calls.size() - 2].size_in, 4096);
  EXPECT_EQ(calls.back().size_in, 10000);

  punctuator_double::QueueReply(Reply{1, 5000, ""});
  punctuator_double::QueueReply(Reply{1, 6000, ""});
  EXPECT_EQ(p.Punctuate("x", true), "");  // no third attempt
  EXPECT_EQ(punctuator_double::Count("punctuator_do_it"), 4);
}

TEST_F(PunctuatorTest, FailuresAndImplausibleSizesGiveEmptyText) {
  Punctuator p = Make(false);
  ASSERT_TRUE(p.Init());
  punctuator_double::QueueReply(Reply{2, 3, "abc"});
  EXPECT_EQ(p.Punctuate("abc", true), "");
  punctuator_double::QueueReply(Reply{0, 5000, "abc"});  // claims more than the buffer
  EXPECT_EQ(p.Punctuate("abc", true), "");
  punctuator_double::QueueReply(Reply{0, -1, ""});
  EXPECT_EQ(p.Punctuate("abc", true), "");
  punctuator_double::QueueReply(Reply{1, -5, ""});
  EXPECT_EQ(p.Punctuate("abc", true), "");
  punctuator_double::QueueReply(Reply{1, 0x7FFFFFFF, ""});  // would need 2 GiB
  EXPECT_EQ(p.Punctuate("abc", true), "");
  EXPECT_EQ(punctuator_double::Count("punctuator_do_it"), 5);
  punctuator_double::QueueReply(Reply{0, 0, ""});
  EXPECT_EQ(p.Punctuate("abc", true), "");  // an empty answer is empty
}

TEST_F(PunctuatorTest, ReleaseFreesTheHandleOnce) {
  {
    Punctuator p = Make(false);
    ASSERT_TRUE(p.Init());
    EXPECT_EQ(punctuator_double::LiveHandles(), 1);
    p.Release();
    EXPECT_EQ(p.Punctuate("abc", true), "");
  }
  EXPECT_EQ(punctuator_double::Count("punctuator_relese"), 1);
  EXPECT_EQ(punctuator_double::LiveHandles(), 0);
}

}  // namespace
}  // namespace speech
}  // namespace vorta
