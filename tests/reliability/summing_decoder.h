// A decoder library that recognises nothing but reports, for every stretch of
// audio it decoded, how many samples it got and a hash of them. It keeps all
// state in its handles, so engines on different threads share nothing in it.
#ifndef KVASR_TESTS_RELIABILITY_SUMMING_DECODER_H_
#define KVASR_TESTS_RELIABILITY_SUMMING_DECODER_H_

#include <cstdint>
#include <string>

namespace summing_decoder {

// One final text of the decoder, read back from a result message.
struct Segment {
  int64_t samples = 0;
  uint64_t hash = 0;
};

// Parses the text of a final result this decoder produced; false otherwise.
bool ParseText(const std::string& text, Segment* segment);


}  // namespace summing_decoder

#endif  // KVASR_TESTS_RELIABILITY_SUMMING_DECODER_H_
