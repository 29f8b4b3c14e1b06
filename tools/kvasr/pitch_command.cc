// SPDX-License-Identifier: Apache-2.0
#include "pitch_command.h"

#include <cstdint>
#include <memory>
#include <vector>

#include "Vortaf0Interface.h"
#include "audio_source.h"

namespace kvasr_cli {
namespace {

constexpr int kFrameSamples = 160;  // 10 ms at 16 kHz
constexpr size_t kReadSamples = 16000;

}  // namespace

int RunPitchCommand(const std::string& input, FILE* out) {
  std::string error;
  std::unique_ptr<AudioSource> audio = OpenAudio(input, &error);
  if (!audio) {
    std::fprintf(stderr, "kvasr: %s: %s\n", input.c_str(), error.c_str());
    return 1;
  }
  PitchConf conf{};
  load_pitch_conf(nullptr, &conf);
  auto tracker = std::make_unique<Vortaf0Interface>(conf, 0);
  tracker->SetToneFeatureOffset(0);
  // The tone values themselves are not printed; they only need a place.
  std::vector<float> tone(static_cast<size_t>(tracker->GetToneFeatureDim()));

  std::fputs(
      "# frame\tf0_hz; frame i is the 10 ms frame of 16 kHz samples "
      "160i .. 160i+159; its value comes from the analysis window centred "
      "at t = 0.01*i - 0.01003125 s (0: unvoiced, silent or not analysed)\n",
      out);
  std::vector<int16_t> samples;
  std::vector<int16_t> chunk;
  size_t used = 0;
  long frame = 0;
  for (;;) {
    if (!audio->Read(kReadSamples, &chunk)) {
      std::fprintf(stderr, "kvasr: %s: %s\n", input.c_str(), audio->error().c_str());
      return 1;
    }
    if (chunk.empty()) break;
    samples.erase(samples.begin(), samples.begin() + static_cast<long>(used));
    samples.insert(samples.end(), chunk.begin(), chunk.end());
    used = 0;
    // One frame per call, so that every frame's raw value is known to be
    // its own.
    for (; used + kFrameSamples <= samples.size(); used += kFrameSamples, ++frame) {
      float period = 0.0f;
      int raw_count = 0;
      int written = 0;
      tracker->ExtractToneFeature(samples.data() + used, kFrameSamples, tone.data(), 1, &written,
                                  &period, 1, &raw_count);
      const float hz = raw_count == 1 && period > 0.0f ? kPitchSampleRateHz / period : 0.0f;
      std::fprintf(out, "%ld\t%.2f\n", frame, hz);
    }
  }
  return 0;
}

}  // namespace kvasr_cli
