// SPDX-License-Identifier: Apache-2.0
#include "transcribe.h"

#include <stdlib.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <exception>
#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>

#include <cpprest/json.h>

#include "audio_source.h"
#include "file_kind.h"
#include "kvasr_offline.h"
#include "model_paths.h"
#include "progress.h"

namespace kvasr_cli {
namespace {

using web::json::value;

constexpr double kProgressMinDurationS = 5.0;
constexpr int kSamplesPerMs = kEngineRateHz / 1000;
constexpr int kTimeoutStatus = -100;

const char* const kPunctPathKeys[] = {"model_path", "vocab_path", "punc_path", "num_path",
                                      "case_path",  "xdb_path",   "bpe_path"};

struct Listener {
  FILE* out = nullptr;
  bool json = false;
  std::string input;
  std::string prefix;  // "FILE\t" when several inputs share the output
  bool timed_out = false;
};

void OnResult(void* /*engine*/, const char* result_json, void* context) {
  auto* listener = static_cast<Listener*>(context);
  try {
    value message = value::parse(result_json);
    if (message.at(U("status")).as_integer() == kTimeoutStatus) listener->timed_out = true;
    if (listener->json) {
      // One object per line, naming its input, so that a line reader needs
      // nothing else to tell the inputs apart.
      message[U("input")] = value::string(listener->input);
      std::fprintf(listener->out, "%s\n", message.serialize().c_str());
    } else {
      const value& result = message.at(U("result"));
      const std::string text = result.at(U("text")).as_string();
      if (result.at(U("isBreak")).as_bool() && !text.empty()) {
        std::fprintf(listener->out, "%s%s\n", listener->prefix.c_str(), text.c_str());
      }
    }
  } catch (const std::exception& e) {
    std::fprintf(stderr, "kvasr: unreadable result message: %s\n", e.what());
  }
  std::fflush(listener->out);
}

// The local_punc_settings object from a settings file, its paths made
// absolute against the file's folder.
bool LoadPunctSettings(const std::string& path, value* settings) {
  std::ifstream in(path);
  if (!in) {
    std::fprintf(stderr, "kvasr: punctuation settings '%s' cannot be read\n", path.c_str());
    return false;
  }
  std::stringstream text;
  text << in.rdbuf();
  try {
    *settings = value::parse(text.str());
    if (!settings->is_object()) throw web::json::json_exception("not an object");
  } catch (const std::exception& e) {
    std::fprintf(stderr, "kvasr: punctuation settings '%s' are not a JSON object: %s\n",
                 path.c_str(), e.what());
    return false;
  }
  const std::string dir =
      path.find('/') == std::string::npos ? "." : path.substr(0, path.rfind('/'));
  for (const char* key : kPunctPathKeys) {
    if (settings->has_field(U(key)) && settings->at(U(key)).is_string()) {
      (*settings)[U(key)] = value::string(ResolveAgainst(dir, settings->at(U(key)).as_string()));
    }
  }
  return true;
}

// Fills in default model paths; false with a message when one is missing.
bool ResolveModels(TranscribeOptions* o) {
  const std::string models = DefaultModelsDir();
  if (o->decoder_model.empty())
    o->decoder_model = models.empty() ? "" : models + "/decoder/en-us.manifest";
  if (o->vad_dir.empty()) o->vad_dir = models.empty() ? "" : models + "/vad";
  if (o->punct && o->punct_settings.empty()) {
    o->punct_settings = models.empty() ? "" : models + "/punct/en/settings.json";
  }
  if (!kvasr_common::IsFile(o->decoder_model)) {
    std::fprintf(stderr, "kvasr: decoder model '%s' not found (use --model)\n",
                 o->decoder_model.c_str());
    return false;
  }
  if (!o->grammar.empty() && !kvasr_common::IsFile(o->grammar)) {
    std::fprintf(stderr, "kvasr: grammar '%s' not found\n", o->grammar.c_str());
    return false;
  }
  if (o->vad && !kvasr_common::IsDirectory(o->vad_dir)) {
    std::fprintf(stderr, "kvasr: VAD model folder '%s' not found (use --vad-models or --no-vad)\n",
                 o->vad_dir.c_str());
    return false;
  }
  return true;
}

// A manifest that takes everything from another one but the grammar, in a
// temporary file that goes with this object.
class GrammarManifest {
 public:
  ~GrammarManifest() {
    if (!path_.empty()) unlink(path_.c_str());
  }

  bool Write(const std::string& base, const std::string& grammar) {
    std::string name =
        (std::filesystem::temp_directory_path() / "kvasr-grammar-XXXXXX.manifest").string();
    const int fd = mkstemps(name.data(), static_cast<int>(std::strlen(".manifest")));
    if (fd < 0) {
      std::fprintf(stderr, "kvasr: no temporary manifest for the grammar: %s\n",
                   std::strerror(errno));
      return false;
    }
    path_ = name;
    const std::string text = "kvasr-decoder-manifest 1\nbase = " + Absolute(base) +
                             "\ngrammar = " + Absolute(grammar) + "\n";
    const bool written = write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    close(fd);
    if (!written)
      std::fprintf(stderr, "kvasr: the temporary manifest %s could not be written\n",
                   path_.c_str());
    return written;
  }

  const std::string& path() const { return path_; }

 private:
  static std::string Absolute(const std::string& path) {
    return std::filesystem::absolute(path).lexically_normal().string();
  }

  std::string path_;
};

std::string InitParams(const TranscribeOptions& o, const std::string& decoder_model,
                       const value* punct_settings) {
  value params = value::object();
  params[U("local_moxwing_model_file_path")] = value::string(decoder_model);
  params[U("local_vad_model_dir_path")] = value::string(o.vad_dir);
  params[U("lang")] = value::string(o.lang);
  params[U("vad_enabled")] = value::boolean(o.vad);
  if (punct_settings) params[U("local_punc_settings")] = *punct_settings;
  return params.serialize();
}

std::string StartParams(const TranscribeOptions& o) {
  value asr = value::object();
  asr[U("max_mute_time_before_voice")] = value::number(o.max_silence_before_ms);
  asr[U("max_mute_time_after_voice")] = value::number(o.max_silence_after_ms);
  value params = value::object();
  params[U("asr")] = asr;
  return params.serialize();
}

// One listening period over one input. False when the input failed.
bool TranscribeOne(void* engine, const std::string& input, const TranscribeOptions& o,
                   const std::string& start_params, Listener* listener) {
  std::string error;
  std::unique_ptr<AudioSource> audio = OpenAudio(input, &error);
  if (!audio) {
    std::fprintf(stderr, "kvasr: %s: %s\n", input.c_str(), error.c_str());
    return false;
  }
  if (audio->rate_hz() < kEngineRateHz) {
    std::fprintf(stderr,
                 "kvasr: %s: warning: %d Hz is below %d Hz; the model is wideband and accuracy "
                 "will suffer\n",
                 input.c_str(), audio->rate_hz(), kEngineRateHz);
  }
  listener->timed_out = false;
  if (vorta_speech_offline_asr_start(engine, start_params.c_str(), OnResult, listener) != 0) {
    std::fprintf(stderr, "kvasr: %s: the engine did not start listening\n", input.c_str());
    return false;
  }
  const size_t chunk_samples = static_cast<size_t>(o.chunk_ms) * kSamplesPerMs;
  const bool show_progress =
      o.progress && isatty(STDERR_FILENO) && audio->duration_s() > kProgressMinDurationS;
  Progress progress(input, audio->duration_s(), show_progress);

  // One chunk of look-ahead, so that the last chunk can be marked as such.
  std::vector<int16_t> current;
  std::vector<int16_t> next;
  bool ok = audio->Read(chunk_samples, &current);
  int packet = 0;
  double fed_s = 0.0;
  while (ok && !current.empty()) {
    ok = audio->Read(chunk_samples, &next);
    if (!ok) break;
    const int marker = next.empty() ? -1 : packet++;
    if (vorta_speech_offline_asr_process_sound_data(
            engine, current.data(), static_cast<int>(current.size()), marker) != 0) {
      if (listener->timed_out) break;  // the listening period ended itself
      std::fprintf(stderr, "kvasr: %s: the engine refused the audio\n", input.c_str());
      ok = false;
      break;
    }
    fed_s += static_cast<double>(current.size()) / kEngineRateHz;
    progress.Update(fed_s);
    current.swap(next);
  }
  progress.Finish();
  if (!ok && !audio->error().empty()) {
    std::fprintf(stderr, "kvasr: %s: %s\n", input.c_str(), audio->error().c_str());
  }
  vorta_speech_offline_asr_stop(engine);
  return ok;
}

}  // namespace

int RunTranscribe(const TranscribeOptions& options, FILE* out) {
  TranscribeOptions o = options;
  if (!ResolveModels(&o)) return 2;
  value punct_settings;
  if (o.punct && !LoadPunctSettings(o.punct_settings, &punct_settings)) return 2;

  GrammarManifest grammar_manifest;
  if (!o.grammar.empty() && !grammar_manifest.Write(o.decoder_model, o.grammar)) return 2;
  const std::string& decoder_model = o.grammar.empty() ? o.decoder_model : grammar_manifest.path();

  void* engine = vorta_speech_create_offline_asr_engine();
  if (vorta_speech_offline_asr_init(
          engine, InitParams(o, decoder_model, o.punct ? &punct_settings : nullptr).c_str()) != 0) {
    std::fprintf(stderr,
                 "kvasr: the models could not be loaded (decoder model '%s'%s%s%s); "
                 "run with --verbose for the library's log\n",
                 o.decoder_model.c_str(),
                 o.grammar.empty() ? "" : (", grammar '" + o.grammar + "'").c_str(),
                 o.vad ? ", VAD models " : "", o.vad ? ("'" + o.vad_dir + "'").c_str() : "");
    vorta_speech_release_offline_asr_engine(engine);
    return 2;
  }
  const std::string start_params = StartParams(o);
  Listener listener;
  listener.out = out;
  listener.json = o.json;
  int failures = 0;
  for (const std::string& input : o.inputs) {
    listener.input = input;
    listener.prefix = o.inputs.size() > 1 ? input + "\t" : "";
    if (!TranscribeOne(engine, input, o, start_params, &listener)) ++failures;
  }
  vorta_speech_offline_asr_close(engine);
  vorta_speech_release_offline_asr_engine(engine);
  return failures == 0 ? 0 : 1;
}

}  // namespace kvasr_cli
