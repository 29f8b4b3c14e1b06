#include "audio_source.h"

#include <cstdio>
#include <cstring>

#include <samplerate.h>
#include <sndfile.h>

namespace kvasr_cli {
namespace {

constexpr size_t kReadBlockFrames = 4096;

class StdinSource : public AudioSource {
 public:
  bool Read(size_t samples, std::vector<int16_t>* chunk) override {
    chunk->resize(samples);
    const size_t n = std::fread(chunk->data(), sizeof(int16_t), samples, stdin);
    chunk->resize(n);
    if (n == 0 && std::ferror(stdin)) {
      error_ = std::strerror(errno);
      return false;
    }
    return true;
  }
  double duration_s() const override { return -1.0; }
};

class FileSource : public AudioSource {
 public:
  FileSource(SNDFILE* file, const SF_INFO& info, SRC_STATE* resampler)
      : file_(file),
        info_(info),
        resampler_(resampler),
        ratio_(static_cast<double>(kEngineRateHz) / info.samplerate) {}

  ~FileSource() override {
    sf_close(file_);
    if (resampler_) src_delete(resampler_);
  }

  bool Read(size_t samples, std::vector<int16_t>* chunk) override {
    while (pending_.size() < samples && !finished_) {
      if (!Refill()) return false;
    }
    const size_t n = std::min(samples, pending_.size());
    chunk->resize(n);
    src_float_to_short_array(pending_.data(), chunk->data(), static_cast<int>(n));
    pending_.erase(pending_.begin(), pending_.begin() + static_cast<long>(n));
    return true;
  }

  double duration_s() const override {
    return static_cast<double>(info_.frames) / info_.samplerate;
  }

 private:
  // Reads one block, mixes it down to mono and brings it to 16 kHz.
  bool Refill() {
    std::vector<float> interleaved(kReadBlockFrames * info_.channels);
    const sf_count_t frames = sf_readf_float(file_, interleaved.data(), kReadBlockFrames);
    if (frames < 0 || sf_error(file_) != SF_ERR_NO_ERROR) {
      error_ = sf_strerror(file_);
      return false;
    }
    std::vector<float> mono(static_cast<size_t>(frames));
    for (sf_count_t f = 0; f < frames; ++f) {
      float sum = 0.0f;
      for (int c = 0; c < info_.channels; ++c) sum += interleaved[f * info_.channels + c];
      mono[f] = sum / info_.channels;
    }
    const bool end = frames == 0;
    if (!resampler_) {
      pending_.insert(pending_.end(), mono.begin(), mono.end());
      finished_ = end;
      return true;
    }
    return Resample(mono, end);
  }

  bool Resample(const std::vector<float>& in, bool end) {
    // The converter may hold input back; on the end flag it drains in steps.
    size_t offset = 0;
    for (;;) {
      std::vector<float> out(static_cast<size_t>((in.size() - offset) * ratio_) + 1024);
      SRC_DATA data{};
      data.data_in = in.data() + offset;
      data.input_frames = static_cast<long>(in.size() - offset);
      data.data_out = out.data();
      data.output_frames = static_cast<long>(out.size());
      data.src_ratio = ratio_;
      data.end_of_input = end ? 1 : 0;
      const int err = src_process(resampler_, &data);
      if (err != 0) {
        error_ = src_strerror(err);
        return false;
      }
      pending_.insert(pending_.end(), out.begin(), out.begin() + data.output_frames_gen);
      offset += static_cast<size_t>(data.input_frames_used);
      if (offset >= in.size() && (!end || data.output_frames_gen == 0)) break;
    }
    finished_ = end;
    return true;
  }

  SNDFILE* file_;
  SF_INFO info_;
  SRC_STATE* resampler_;
  double ratio_;
  std::vector<float> pending_;
  bool finished_ = false;
};

}  // namespace

std::unique_ptr<AudioSource> OpenAudio(const std::string& path, std::string* error) {
  if (path == "-") return std::make_unique<StdinSource>();
  SF_INFO info{};
  SNDFILE* file = sf_open(path.c_str(), SFM_READ, &info);
  if (!file) {
    *error = sf_strerror(nullptr);
    return nullptr;
  }
  if (info.channels < 1 || info.samplerate < 1) {
    sf_close(file);
    *error = "no audio channels";
    return nullptr;
  }
  SRC_STATE* resampler = nullptr;
  if (info.samplerate != kEngineRateHz) {
    int err = 0;
    resampler = src_new(SRC_SINC_MEDIUM_QUALITY, 1, &err);
    if (!resampler) {
      sf_close(file);
      *error = src_strerror(err);
      return nullptr;
    }
  }
  return std::make_unique<FileSource>(file, info, resampler);
}

}  // namespace kvasr_cli
