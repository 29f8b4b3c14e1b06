// SPDX-License-Identifier: Apache-2.0
#include "audio_source.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include <samplerate.h>
#include <sndfile.h>

namespace kvasr_cli {
namespace {

constexpr size_t kReadBlockFrames = 4096;

// Enough of a stream's start to tell a container from raw samples.
constexpr size_t kSniffBytes = 12;

// Raw 16 kHz s16le mono; `prefix` holds bytes already taken from the stream.
class StdinSource : public AudioSource {
 public:
  explicit StdinSource(std::string prefix) : prefix_(std::move(prefix)) {}

  bool Read(size_t samples, std::vector<int16_t>* chunk) override {
    chunk->resize(samples);
    char* bytes = reinterpret_cast<char*>(chunk->data());
    const size_t wanted = samples * sizeof(int16_t);
    const size_t from_prefix = std::min(wanted, prefix_.size());
    std::memcpy(bytes, prefix_.data(), from_prefix);
    prefix_.erase(0, from_prefix);
    const size_t got =
        from_prefix + std::fread(bytes + from_prefix, 1, wanted - from_prefix, stdin);
    // A trailing odd byte is no sample.
    chunk->resize(got / sizeof(int16_t));
    if (got < wanted && std::ferror(stdin)) {
      error_ = std::strerror(errno);
      return false;
    }
    return true;
  }
  double duration_s() const override { return -1.0; }
  int rate_hz() const override { return kEngineRateHz; }

 private:
  std::string prefix_;
};

// A whole stream in memory, for libsndfile, which seeks in what it reads.
struct MemoryFile {
  std::string bytes;
  sf_count_t position = 0;

  static sf_count_t Length(void* self) {
    return static_cast<sf_count_t>(static_cast<MemoryFile*>(self)->bytes.size());
  }
  static sf_count_t Seek(sf_count_t offset, int whence, void* self) {
    auto* m = static_cast<MemoryFile*>(self);
    const sf_count_t base = whence == SEEK_SET ? 0 : whence == SEEK_CUR ? m->position : Length(m);
    m->position = std::clamp<sf_count_t>(base + offset, 0, Length(m));
    return m->position;
  }
  static sf_count_t Read(void* out, sf_count_t count, void* self) {
    auto* m = static_cast<MemoryFile*>(self);
    const sf_count_t n = std::min(count, Length(m) - m->position);
    std::memcpy(out, m->bytes.data() + m->position, static_cast<size_t>(n));
    m->position += n;
    return n;
  }
  static sf_count_t Write(const void* /*in*/, sf_count_t /*count*/, void* /*self*/) { return 0; }
  static sf_count_t Tell(void* self) { return static_cast<MemoryFile*>(self)->position; }
};

// Whether a stream starting with `head` is a container libsndfile reads
// rather than raw samples.
bool IsContainer(const std::string& head) {
  static const char* const kMagics[] = {"RIFF", "RIFX", "RF64", "fLaC", "OggS",
                                        "FORM", ".snd", "caff", "ID3"};
  for (const char* magic : kMagics) {
    if (head.compare(0, std::strlen(magic), magic) == 0) return true;
  }
  return false;
}

class FileSource : public AudioSource {
 public:
  FileSource(SNDFILE* file, const SF_INFO& info, SRC_STATE* resampler,
             std::unique_ptr<MemoryFile> memory)
      : memory_(std::move(memory)),
        file_(file),
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
  int rate_hz() const override { return info_.samplerate; }

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

  // What file_ reads when it came from standard input; outlives file_.
  std::unique_ptr<MemoryFile> memory_;
  SNDFILE* file_;
  SF_INFO info_;
  SRC_STATE* resampler_;
  double ratio_;
  std::vector<float> pending_;
  bool finished_ = false;
};

}  // namespace

std::unique_ptr<AudioSource> OpenAudio(const std::string& path, std::string* error) {
  SF_INFO info{};
  SNDFILE* file = nullptr;
  std::unique_ptr<MemoryFile> memory;
  if (path == "-") {
    std::string head(kSniffBytes, '\0');
    head.resize(std::fread(head.data(), 1, head.size(), stdin));
    if (!IsContainer(head)) return std::make_unique<StdinSource>(std::move(head));
    memory = std::make_unique<MemoryFile>();
    memory->bytes = std::move(head);
    char block[1 << 16];
    size_t n;
    while ((n = std::fread(block, 1, sizeof block, stdin)) > 0) memory->bytes.append(block, n);
    if (std::ferror(stdin)) {
      *error = std::strerror(errno);
      return nullptr;
    }
    static SF_VIRTUAL_IO io = {MemoryFile::Length, MemoryFile::Seek, MemoryFile::Read,
                               MemoryFile::Write, MemoryFile::Tell};
    file = sf_open_virtual(&io, SFM_READ, &info, memory.get());
  } else {
    file = sf_open(path.c_str(), SFM_READ, &info);
  }
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
  return std::make_unique<FileSource>(file, info, resampler, std::move(memory));
}

}  // namespace kvasr_cli
