// SPDX-License-Identifier: Apache-2.0
#include "vad/kv_vad.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "quellan_double.h"

namespace vorta {
namespace speech {
namespace {

using quellan_double::Output;
using Segments = std::vector<std::pair<std::vector<uint16_t>, bool>>;  // samples, finished

Output Speech(std::vector<int16_t> samples, int continued, int ended) {
  return Output{std::move(samples), 1, continued, ended};
}

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

  // Every segment on hand, up to the empty open one.
  Segments Take() {
    Segments out;
    for (;;) {
      bool finished = false;
      std::vector<uint16_t> segment = vad_.TakeSegment(&finished);
      if (segment.empty() && !finished) return out;
      out.emplace_back(std::move(segment), finished);
    }
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

TEST_F(VadBufferTest, SegmentsCloseOnTheModulesEndOrTheCallersLastChunk) {
  struct Case {
    const char* what;
    std::vector<Output> outputs;
    std::vector<bool> ends;  // one chunk each
    Segments expected;
  };
  const Case cases[] = {
      // Kept on purpose: a segment that opens and ends within one call stays
      // open until the next call that ends it.
      {"begins and ends in one call",
       {Speech({1, 2}, 0, 1), Speech({3}, 1, 0), Speech({4}, 1, 1)},
       {false, false, false},
       {{{1, 2, 3, 4}, true}}},
      {"closed by the last chunk", {Speech({5}, 0, 0)}, {false, true}, {{{5}, true}}},
      {"two queued segments",
       {Speech({1}, 0, 0), Speech({2}, 1, 1), Speech({7}, 0, 0), Speech({8}, 1, 1)},
       {false, false, false, false},
       {{{1, 2}, true}, {{7, 8}, true}}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    ASSERT_TRUE(vad_.Start());
    for (const Output& o : c.outputs) quellan_double::QueueOutput(o);
    for (bool end : c.ends) Feed(160, end);
    EXPECT_EQ(Take(), c.expected);
  }
}

using VadBufferDeathTest = VadBufferTest;

TEST_F(VadBufferDeathTest, ProcessInWithoutModuleOrStartAborts) {
  Vad never_initialised("models");
  std::vector<uint16_t> chunk(160);
  EXPECT_DEATH(never_initialised.ProcessIn(chunk.data(), chunk.size(), false), "m_vad_ptr");
  vad_.Reset();
  EXPECT_DEATH(Feed(160), "!m_data.empty\\(\\)");
}

}  // namespace
}  // namespace speech
}  // namespace vorta
