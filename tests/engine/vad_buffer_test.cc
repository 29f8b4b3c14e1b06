#include "vad/kv_vad.h"

#include <gtest/gtest.h>

#include <vector>

#include "quellan_double.h"
#include "test_support.h"

namespace vorta {
namespace speech {
namespace {

using kvasr_test::Stdout;
using quellan_double::Output;

Output Speech(std::vector<int16_t> samples, int continued, int ended) {
  return Output{std::move(samples), 1, continued, ended};
}

std::vector<uint16_t> U(std::vector<int16_t> s) { return std::vector<uint16_t>(s.begin(), s.end()); }

class VadBufferTest : public testing::Test {
 protected:
  void SetUp() override {
    quellan_double::Reset();
    ASSERT_TRUE(vad_.Init());
    ASSERT_TRUE(vad_.Start());
  }

  void Feed(size_t len, bool end = false) {
    std::vector<uint16_t> chunk(len, 0);
    vad_.ProcessIn(chunk.data(), chunk.size(), end);
  }

  std::vector<int> Indices() const {
    std::vector<int> out;
    for (const auto& c : quellan_double::Calls()) {
      if (c.name == "quellan_process_wave") out.push_back(c.index);
    }
    return out;
  }

  Vad vad_{"models"};
};

TEST_F(VadBufferTest, CallIndexCountsNonEmptyChunksAndIsNegatedOnTheLast) {
  Feed(0, true);  // ignored entirely
  Feed(160, true);
  Feed(160);
  Feed(0);
  Feed(320, true);
  EXPECT_EQ(Indices(), (std::vector<int>{-1, 2, -3}));
  EXPECT_EQ(quellan_double::Calls().back().len, 320);
  EXPECT_EQ(quellan_double::Calls().back().out_capacity, 320 + 32000);

  ASSERT_TRUE(vad_.Start());  // every listening period starts at 1 again
  Feed(160);
  EXPECT_EQ(Indices().back(), 1);
}

TEST_F(VadBufferTest, OpenSegmentIsHandedOutAsItGrows) {
  quellan_double::QueueOutput(Speech({1, 2}, 0, 0));
  quellan_double::QueueOutput(Speech({3}, 1, 0));
  Feed(160);
  bool finished = false;
  EXPECT_EQ(vad_.TakeSegment(&finished), U({1, 2}));
  EXPECT_FALSE(finished);
  Feed(160);
  EXPECT_EQ(vad_.TakeSegment(&finished), U({3}));
  EXPECT_FALSE(finished);
  EXPECT_TRUE(vad_.TakeSegment(&finished).empty());
}

TEST_F(VadBufferTest, SegmentThatBeginsAndEndsInOneCallClosesOnlyLater) {
  quellan_double::QueueOutput(Speech({1, 2}, 0, 1));  // opens and ends at once
  quellan_double::QueueOutput(Speech({3}, 1, 0));     // no end: stays open
  quellan_double::QueueOutput(Speech({4}, 1, 1));     // ends: closes
  Feed(160);
  Feed(160);
  bool finished = false;
  Feed(160);
  EXPECT_EQ(vad_.TakeSegment(&finished), U({1, 2, 3, 4}));
  EXPECT_TRUE(finished);
  finished = false;
  EXPECT_TRUE(vad_.TakeSegment(&finished).empty());
  EXPECT_FALSE(finished);
}

TEST_F(VadBufferTest, LastChunkClosesAnOpenSegmentEvenWithoutSpeech) {
  quellan_double::QueueOutput(Speech({5}, 0, 0));
  Feed(160);
  Feed(160, true);  // module reports nothing, the caller's end closes it
  bool finished = false;
  EXPECT_EQ(vad_.TakeSegment(&finished), U({5}));
  EXPECT_TRUE(finished);
}

TEST_F(VadBufferTest, TwoQueuedSegmentsComeOutOneAtATime) {
  quellan_double::QueueOutput(Speech({1}, 0, 0));
  quellan_double::QueueOutput(Speech({2}, 1, 1));
  quellan_double::QueueOutput(Speech({7}, 0, 0));
  quellan_double::QueueOutput(Speech({8}, 1, 1));
  for (int i = 0; i < 4; ++i) Feed(160);
  bool finished = false;
  EXPECT_EQ(vad_.TakeSegment(&finished), U({1, 2}));
  EXPECT_TRUE(finished);
  finished = false;
  EXPECT_EQ(vad_.TakeSegment(&finished), U({7, 8}));
  EXPECT_TRUE(finished);
  finished = false;
  EXPECT_TRUE(vad_.TakeSegment(&finished).empty());
  EXPECT_FALSE(finished);
}

TEST_F(VadBufferTest, InitAndStartFailures) {
  quellan_double::SetCreateThrowsFor("bad");
  Vad throwing("bad");
  EXPECT_EQ(Stdout([&] { EXPECT_FALSE(throwing.Init()); }), "vad init exception:init vad failed\n");
  EXPECT_FALSE(throwing.Start());

  quellan_double::SetCreateReturnsNullFor("empty");
  Vad unconfigured("empty");
  EXPECT_TRUE(unconfigured.Init());
  EXPECT_FALSE(unconfigured.Start());
}

TEST_F(VadBufferTest, ReleaseDestroysTheModuleOnce) {
  vad_.Release();
  vad_.Release();
  EXPECT_EQ(quellan_double::Count("quellan_destroy"), 1);
  EXPECT_EQ(quellan_double::LiveHandles(), 0);
  EXPECT_FALSE(vad_.Start());
}

using VadBufferDeathTest = VadBufferTest;

TEST_F(VadBufferDeathTest, ProcessInAfterResetWithoutStartAborts) {
  vad_.Reset();
  EXPECT_DEATH(Feed(160), "!m_data.empty\\(\\)");
}

TEST_F(VadBufferDeathTest, ProcessInWithoutModuleAborts) {
  Vad never_initialised("models");
  std::vector<uint16_t> chunk(160);
  EXPECT_DEATH(never_initialised.ProcessIn(chunk.data(), chunk.size(), false), "m_vad_ptr");
}

}  // namespace
}  // namespace speech
}  // namespace vorta
