// SPDX-License-Identifier: Apache-2.0
// A decoder library that recognises nothing but reports, for every stretch of
// audio it decoded, how many samples it got and a hash of them. It keeps all
// state in its handles, so engines on different threads share nothing in it.
#ifndef KVASR_TESTS_RELIABILITY_SUMMING_DECODER_H_
#define KVASR_TESTS_RELIABILITY_SUMMING_DECODER_H_

#include <cstdint>
#include <string>

namespace summing_decoder {

// The sample count in the text of a final result this decoder produced;
// false for any other text.
bool ParseSamples(const std::string& text, int64_t* samples);
}  // namespace summing_decoder

#endif  // KVASR_TESTS_RELIABILITY_SUMMING_DECODER_H_
