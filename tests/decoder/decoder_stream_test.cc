// SPDX-License-Identifier: Apache-2.0
// Streaming through the mw* functions on real speech: result order and
// count per utterance, restarts, independent instances, speech-end
// detection, and calls out of order or out of range.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "decoder_test_support.h"
#include "kvasr_decoder_api.h"
#include "kvasr_decoder_constants.h"

namespace kvasr_decoder_test {
namespace {

// One 10 ms frame: the resolution of speech-end detection.
constexpr int64_t kFrameSamples = 10 * kSamplesPerMs;
// The front end's own hangover before it calls speech over.
constexpr int64_t kHangoverMs = 500;

// Consecutive utterances of one decoder are not independent (the front
// end's running estimates carry over), so later ones are told apart by a
// word only their own recording has, and that the model gets right.
constexpr char kClipWord[] = "young";
constexpr char kOtherClipWord[] = "might";

bool HasWord(const std::string& text, const std::string& word) {
  return (" " + text + " ").find(" " + word + " ") != std::string::npos;
}

std::vector<int16_t> WithSilence(int64_t before_ms, std::vector<int16_t> samples,
                                 int64_t after_ms) {
  samples.insert(samples.begin(), before_ms * kSamplesPerMs, 0);
  samples.insert(samples.end(), after_ms * kSamplesPerMs, 0);
  return samples;
}

class DecoderStream : public testing::Test {
 protected:
  void SetUp() override {
    KVASR_REQUIRE_LIBRIVOX();
    clip_ = LibrivoxClip("0880");        // "he was not an ill disposed young man"
    other_clip_ = LibrivoxClip("0930");  // "he might even have been made amiable himself"
    ASSERT_FALSE(clip_.empty() || other_clip_.empty());
  }

  // Final text of `samples` as the first utterance of a fresh decoder, fed
  // in one piece.
  static std::string DecodeAlone(const std::vector<int16_t>& samples) {
    Session session;
    session.Feed(samples, static_cast<int64_t>(samples.size()), true);
    return session.Finals().size() == 1 ? session.Finals()[0].text : "(not one final)";
  }

  std::vector<int16_t> clip_;
  std::vector<int16_t> other_clip_;
};

TEST_F(DecoderStream, ChangingPartialsThenOneFinalWhateverTheChunking) {
  const std::string reference = DecodeAlone(clip_);
  ASSERT_TRUE(HasWord(reference, kClipWord)) << reference;
  for (int64_t chunk_samples : {int64_t{1}, kChunkSamples}) {
    SCOPED_TRACE(chunk_samples);
    Session session;
    session.Feed(clip_, chunk_samples, true);
    EXPECT_EQ(session.Stop(), 0);
    const std::vector<Event>& events = session.events();
    ASSERT_GE(events.size(), 2u);
    for (size_t i = 0; i + 1 < events.size(); ++i) {
      EXPECT_EQ(events[i].flag_or_reason, 0);
      EXPECT_EQ(events[i].score, KVASR_DECODER_SCORE_UNAVAILABLE);
      EXPECT_NE(events[i].text, i == 0 ? "" : events[i - 1].text);
    }
    EXPECT_EQ(events.back().flag_or_reason, 1);
    EXPECT_EQ(events.back().text, reference);
    EXPECT_GT(events.back().score, 0.0f);
    EXPECT_LE(events.back().score, 1.0f);
  }
}

TEST_F(DecoderStream, EveryUtteranceEndsInOneFinalOfItsOwnWords) {
  Session session;
  EXPECT_EQ(session.Stop(), 0);  // no utterance yet: nothing
  session.Feed(clip_, kChunkSamples, true);
  EXPECT_EQ(session.Stop(), 0);                    // the last chunk already ended it
  session.Feed(other_clip_, kChunkSamples, true);  // data alone opens the next
  session.Feed(other_clip_);
  ASSERT_EQ(mwStartDecode(session.handle()), 0);  // drops the unfinished one
  session.Feed(clip_);
  EXPECT_EQ(session.Stop(), 0);
  ASSERT_EQ(mwStartDecode(session.handle()), 0);
  EXPECT_EQ(session.Stop(), 0);  // an utterance without audio: empty final
  const std::vector<Event> finals = session.Finals();
  ASSERT_EQ(finals.size(), 4u);
  EXPECT_TRUE(HasWord(finals[0].text, kClipWord) && !HasWord(finals[0].text, kOtherClipWord));
  EXPECT_TRUE(HasWord(finals[1].text, kOtherClipWord) && !HasWord(finals[1].text, kClipWord));
  EXPECT_TRUE(HasWord(finals[2].text, kClipWord) && !HasWord(finals[2].text, kOtherClipWord));
  EXPECT_EQ(finals[3].text, "");
  EXPECT_EQ(finals[3].score, 0.0f);
}

TEST_F(DecoderStream, InstancesSideBySideKeepToThemselves) {
  const std::string references[] = {DecodeAlone(clip_), DecodeAlone(other_clip_)};
  Session sessions[2];
  const std::vector<int16_t>* clips[] = {&clip_, &other_clip_};
  for (size_t at = 0; at < std::max(clip_.size(), other_clip_.size()); at += kChunkSamples) {
    for (int i : {0, 1}) {
      if (at >= clips[i]->size()) continue;
      const auto end = clips[i]->begin() + std::min(clips[i]->size(), at + kChunkSamples);
      sessions[i].Feed(std::vector<int16_t>(clips[i]->begin() + at, end));
    }
  }
  for (int i : {0, 1}) {
    EXPECT_EQ(sessions[i].Stop(), 0);
    ASSERT_EQ(sessions[i].Finals().size(), 1u);
    EXPECT_EQ(sessions[i].Finals()[0].text, references[i]);
  }
}

// Where (in samples fed, to the frame) speech end is reported once with
// `reason`; -1 if it is not reported exactly once.
int64_t SpeechEndAt(const std::vector<int16_t>& audio, int32_t leading_ms, int32_t trailing_ms,
                    int reason) {
  Session session;
  EXPECT_EQ(mwSetVadEnabled(session.handle(), 1), 0);
  EXPECT_EQ(mwSetVadThreshold(session.handle(), leading_ms, trailing_ms), 0);
  session.Feed(audio, kFrameSamples);
  const std::vector<Event> ends = session.SpeechEnds();
  if (ends.size() != 1 || ends[0].flag_or_reason != reason) return -1;
  return ends[0].at_samples;
}

TEST_F(DecoderStream, TrailingSilenceLimitIsMillisecondsAfterSpeech) {
  const std::vector<int16_t> audio = WithSilence(1000, clip_, 3000);
  const int64_t clip_end = 1000 * kSamplesPerMs + static_cast<int64_t>(clip_.size());
  const int silence = KVASR_DECODER_SPEECH_END_SILENCE;
  const int64_t at_0 = SpeechEndAt(audio, 5000, 0, silence);
  const int64_t at_1000 = SpeechEndAt(audio, 5000, 1000, silence);
  const int64_t at_2000 = SpeechEndAt(audio, 5000, 2000, silence);
  ASSERT_GT(at_0, 0);
  // The recording's tail is partly silent already.
  EXPECT_GT(at_1000, clip_end);
  EXPECT_LE(at_1000, clip_end + 1000 * kSamplesPerMs);
  // Limits below the hangover act as the hangover; beyond it every
  // millisecond counts.
  EXPECT_NEAR(at_1000 - at_0, (1000 - kHangoverMs) * kSamplesPerMs, kFrameSamples);
  EXPECT_NEAR(at_2000 - at_1000, 1000 * kSamplesPerMs, kFrameSamples);
}

TEST_F(DecoderStream, LeadingSilenceLimitEndsAnUtteranceWithoutSpeech) {
  const std::vector<int16_t> quiet = WithSilence(6000, {}, 0);
  const int no_speech = KVASR_DECODER_SPEECH_END_NO_SPEECH;
  EXPECT_NEAR(SpeechEndAt(quiet, 5000, 1000, no_speech), 5000 * kSamplesPerMs, kFrameSamples);
  EXPECT_NEAR(SpeechEndAt(quiet, 2000, 1000, no_speech), 2000 * kSamplesPerMs, kFrameSamples);
  EXPECT_EQ(SpeechEndAt(quiet, 0, 1000, no_speech), -1);
}

TEST_F(DecoderStream, AutoStopFinishesTheUtteranceAtSpeechEnd) {
  const std::vector<int16_t> audio = WithSilence(1000, clip_, 3000);
  Session session;
  ASSERT_EQ(mwSetAutoStopEnabled(session.handle(), 1), 0);
  session.Feed(audio);  // detection is off by default, and auto-stop needs it
  EXPECT_TRUE(session.SpeechEnds().empty());
  EXPECT_TRUE(session.Finals().empty());
  ASSERT_EQ(mwStartDecode(session.handle()), 0);
  ASSERT_EQ(mwSetVadEnabled(session.handle(), 1), 0);
  session.Feed(audio);
  const std::vector<Event> ends = session.SpeechEnds();
  ASSERT_EQ(ends.size(), 1u);
  ASSERT_EQ(session.Finals().size(), 1u);
  EXPECT_EQ(session.Finals()[0].at_samples, ends[0].at_samples);
  EXPECT_TRUE(HasWord(session.Finals()[0].text, kClipWord));
  // The silence after the speech end opened an utterance of its own.
  EXPECT_EQ(session.Stop(), 0);
  ASSERT_EQ(session.Finals().size(), 2u);
  EXPECT_EQ(session.Finals()[1].text, "");
}

TEST(DecoderCalls, NullHandlesAndOutOfRangeArgumentsAreRefused) {
  const int16_t samples[4] = {};
  EXPECT_LT(mwSetVadEnabled(nullptr, 1), 0);
  EXPECT_LT(mwSetAutoStopEnabled(nullptr, 1), 0);
  EXPECT_LT(mwSetVadThreshold(nullptr, 5000, 1000), 0);
  EXPECT_LT(mwSetOutHandle(nullptr, nullptr), 0);
  EXPECT_LT(mwSetOnSpeechEnd(nullptr, nullptr), 0);
  EXPECT_LT(mwSetOnResult(nullptr, nullptr), 0);
  EXPECT_LT(mwStartDecode(nullptr), 0);
  EXPECT_LT(mwSetData(nullptr, samples, 4, 1), 0);
  EXPECT_LT(mwStopDecode(nullptr), 0);
  mwDecoderDestroy(nullptr);

  Session session;
  EXPECT_EQ(mwSetData(session.handle(), nullptr, 0, 1), 0);
  EXPECT_EQ(mwSetData(session.handle(), nullptr, 4, 0), KVASR_DECODER_ERR_ARGUMENT);
  EXPECT_EQ(mwSetData(session.handle(), samples, -1, 0), KVASR_DECODER_ERR_ARGUMENT);
  EXPECT_EQ(mwSetData(session.handle(), samples, INT64_MAX, 1), KVASR_DECODER_ERR_ARGUMENT);
  EXPECT_EQ(mwSetVadThreshold(session.handle(), -1, 1000), KVASR_DECODER_ERR_ARGUMENT);
  EXPECT_EQ(mwSetVadThreshold(session.handle(), 5000, -1), KVASR_DECODER_ERR_ARGUMENT);
  // None of them began an utterance.
  EXPECT_EQ(session.Stop(), 0);
  EXPECT_TRUE(session.events().empty());
}

TEST_F(DecoderStream, CallsFromInsideACallbackAreRefused) {
  for (auto reentry :
       {Session::Reentry::kFeed, Session::Reentry::kStop, Session::Reentry::kStart}) {
    Session session;
    session.set_reentry(reentry);
    session.Feed(clip_, kChunkSamples, true);
    ASSERT_FALSE(session.events().empty());
    for (const Event& e : session.events()) EXPECT_EQ(e.reentry_result, KVASR_DECODER_ERR_BUSY);
    ASSERT_EQ(session.Finals().size(), 1u);
    EXPECT_TRUE(HasWord(session.Finals()[0].text, kClipWord));
  }
}

TEST_F(DecoderStream, DestroyFromInsideACallbackEndsAllCallbacks) {
  Session session;
  ASSERT_EQ(mwSetVadEnabled(session.handle(), 1), 0);
  ASSERT_EQ(mwSetAutoStopEnabled(session.handle(), 1), 0);
  session.set_reentry(Session::Reentry::kDestroy);
  // In one chunk the speech-end callback comes first, and auto-stop would
  // deliver a final right after it.
  const std::vector<int16_t> audio = WithSilence(0, clip_, 2000);
  session.Feed(audio, static_cast<int64_t>(audio.size()));
  EXPECT_EQ(session.handle(), nullptr);
  ASSERT_EQ(session.events().size(), 1u);
  EXPECT_FALSE(session.events()[0].is_result);
}

}  // namespace
}  // namespace kvasr_decoder_test
