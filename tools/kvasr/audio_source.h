// SPDX-License-Identifier: Apache-2.0
// Sound for the engine: any file libsndfile reads, from a path or standard
// input (where a stream without a container header is raw 16 kHz s16le
// mono), delivered as 16 kHz mono 16-bit chunks.
#ifndef KVASR_TOOLS_KVASR_AUDIO_SOURCE_H_
#define KVASR_TOOLS_KVASR_AUDIO_SOURCE_H_

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace kvasr_cli {

constexpr int kEngineRateHz = 16000;

class AudioSource {
 public:
  virtual ~AudioSource() = default;
  // Fills `chunk` with up to `samples` samples; an empty chunk means the end.
  // False on a read error (the message is in error()).
  virtual bool Read(size_t samples, std::vector<int16_t>* chunk) = 0;
  // Length in seconds at 16 kHz, or a negative value when unknown.
  virtual double duration_s() const = 0;
  // The rate of the recording before conversion.
  virtual int rate_hz() const = 0;
  const std::string& error() const { return error_; }

 protected:
  std::string error_;
};

// Opens `path`, or standard input for "-". Null with `*error` set when the
// input cannot be used.
std::unique_ptr<AudioSource> OpenAudio(const std::string& path, std::string* error);

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_AUDIO_SOURCE_H_
