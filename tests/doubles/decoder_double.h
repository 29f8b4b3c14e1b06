// SPDX-License-Identifier: Apache-2.0
// Scriptable stand-in for the decoder library: records every mw* call and
// fires the callbacks a test asks for.
#ifndef KVASR_TESTS_DOUBLES_DECODER_DOUBLE_H_
#define KVASR_TESTS_DOUBLES_DECODER_DOUBLE_H_

#include <cstdint>
#include <string>
#include <vector>

namespace decoder_double {

struct Call {
  std::string name;
  std::vector<int64_t> args;     // integer arguments in order (handle excluded)
  std::vector<int16_t> samples;  // mwSetData only
  std::string model;             // mwDecoderInit only: the file's content
};

// A callback to fire from inside a call.
struct Event {
  enum Kind { kResult, kSpeechEnd } kind = kResult;
  std::string text;
  bool null_text = false;
  float score = 0.0f;
  int flag = 0;
};

void Reset();
// Forgets the recorded calls only; decoders and scripts stay.
void ClearCalls();
const std::vector<Call>& Calls();
// Names of the calls in order, e.g. {"mwStartDecode", "mwSetData"}.
std::vector<std::string> CallNames();
int Count(const std::string& name);
int LiveDecoders();

void SetInitFails(bool fails);
void SetStartResult(int result);
// Results of the following mwSetData calls, in order; 0 once exhausted.
void QueueSetDataResult(int result);

// Events fired during the next call of mwSetData / mwStopDecode (one batch per call).
void QueueOnSetData(std::vector<Event> batch);
void QueueOnStop(std::vector<Event> batch);

Event Result(const std::string& text, int flag, float score = 0.5f);
Event SpeechEnd();

}  // namespace decoder_double

#endif  // KVASR_TESTS_DOUBLES_DECODER_DOUBLE_H_
