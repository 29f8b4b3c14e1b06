// SPDX-License-Identifier: Apache-2.0
#include "vad_run.h"

#include <algorithm>

namespace kvasr_cli {
namespace {

// Room for every interval one call can emit, whatever the chunk length.
constexpr int kOutSlackSamples = 5 * 32000;

class FrameRecorder : public VadFrameObserver {
 public:
  FrameRecorder(VadRunResult* result, bool keep_features)
      : result_(result), keep_features_(keep_features) {}

  void on_frame(const VadFrameReport& r) override {
    const size_t frame = static_cast<size_t>(r.frame);
    if (result_->frames.size() <= frame) result_->frames.resize(frame + 1);
    result_->frames[frame] = VadFrame{r.score, r.smoothed, static_cast<uint8_t>(r.energy_speech),
                                      static_cast<uint8_t>(r.speech), 0};
    if (!keep_features_) return;
    result_->feat_dim = r.feat_dim;
    const size_t width = static_cast<size_t>(r.feat_dim);
    if (result_->features.size() < (frame + 1) * width) {
      result_->features.resize((frame + 1) * width);
    }
    std::copy(r.features, r.features + width,
              result_->features.begin() + static_cast<long>(frame * width));
  }

 private:
  VadRunResult* result_;
  bool keep_features_;
};

// Turns the intervals of successive calls into whole segments. A call that
// adds no frame repeats the previous call's intervals; those are skipped.
class SegmentCollector {
 public:
  explicit SegmentCollector(std::vector<VadSegment>* segments) : segments_(segments) {}

  void Take(const Cquellan& pipe) {
    for (int i = 0; i < pipe.emitted_count(); ++i) {
      const Cquellan::Interval iv = pipe.emitted(i);
      if (iv.end_frame <= last_end_) continue;
      if (!open_) {
        open_ = true;
        // A head margin may reach back into the previous segment, whose
        // audio the caller already has.
        begin_ = std::max(iv.begin_frame, last_end_ + 1);
      }
      last_end_ = iv.end_frame;
      if (iv.closes) Close();
    }
  }

  void Finish() {
    if (open_) Close();
  }

 private:
  void Close() {
    segments_->push_back(VadSegment{begin_, last_end_});
    open_ = false;
  }

  std::vector<VadSegment>* segments_;
  bool open_ = false;
  int begin_ = 0;
  int last_end_ = -1;
};

void AddRunningStatistics(const PLP& plp, VadRunResult* result) {
  if (plp.first_call()) return;  // nothing normalised yet
  const std::vector<float>& mean = plp.running_mean();
  const std::vector<float>& var = plp.running_variance();
  result->running_mean_sum.resize(mean.size(), 0.0);
  result->running_var_sum.resize(var.size(), 0.0);
  for (size_t i = 0; i < mean.size(); ++i) {
    result->running_mean_sum[i] += mean[i];
    result->running_var_sum[i] += var[i];
  }
  ++result->stat_calls;
}

}  // namespace

bool RunVad(Cquellan* pipe, AudioSource* source, const VadRunOptions& options, VadRunResult* result,
            std::string* error) {
  *result = VadRunResult{};
  FrameRecorder recorder(result, options.keep_features);
  SegmentCollector segments(&result->segments);
  pipe->set_frame_observer(&recorder);
  std::vector<int16_t> chunk;
  std::vector<int16_t> next;
  std::vector<int16_t> out(static_cast<size_t>(options.chunk_samples) + kOutSlackSamples);
  bool ok = source->Read(options.chunk_samples, &chunk);
  int index = 0;
  while (ok && !chunk.empty()) {
    ok = source->Read(options.chunk_samples, &next);
    if (!ok) break;
    ++index;
    const int call_index = next.empty() ? -index : index;
    int out_len = 0, speech = 0, continued = 0, ended = 0;
    if (pipe->quellan_process(call_index, chunk.data(), static_cast<int>(chunk.size()), out.data(),
                              static_cast<int>(out.size()), &out_len, &speech, &continued,
                              &ended) != 0) {
      *error = "the detector failed on chunk " + std::to_string(index);
      pipe->set_frame_observer(nullptr);
      return false;
    }
    segments.Take(*pipe);
    AddRunningStatistics(pipe->feature_extractor(), result);
    if (options.keep_samples) {
      result->samples.insert(result->samples.end(), chunk.begin(), chunk.end());
    }
    chunk.swap(next);
  }
  pipe->set_frame_observer(nullptr);
  if (!ok) {
    *error = source->error();
    return false;
  }
  segments.Finish();
  for (const VadSegment& s : result->segments) {
    const int end = std::min<int>(s.end_frame + 1, result->frames.size());
    for (int f = std::max(s.begin_frame, 0); f < end; ++f) {
      result->frames[f].emitted = 1;
    }
  }
  return true;
}

}  // namespace kvasr_cli
