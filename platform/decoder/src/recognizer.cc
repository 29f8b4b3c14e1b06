// SPDX-License-Identifier: Apache-2.0
#include "recognizer.h"

#include <err.h>
#include <pocketsphinx.h>
#include <sphinxbase/ckd_alloc.h>
#include <sphinxbase/fsg_model.h>
#include <sphinxbase/jsgf.h>

#include <algorithm>
#include <cctype>
#include <cstring>
#include <fstream>
#include <mutex>
#include <sstream>
#include <vector>

#include "kvasr_decoder_constants.h"

namespace kvasr::decoder {
namespace {

// The interface fixes the audio at 16 kHz.
constexpr int64_t kSampleRateHz = 16000;
constexpr int64_t kSamplesPerMs = kSampleRateHz / 1000;

// PocketSphinx counts frames and samples of an utterance in 32-bit integers,
// so a single chunk beyond that cannot be meant.
constexpr int64_t kMaxChunkSamples = INT32_MAX;

// The engine's own choice (5 s, 1 s) is also what a decoder gets before
// anyone sets the limits.
constexpr int32_t kDefaultLeadingSilenceMs = 5000;
constexpr int32_t kDefaultTrailingSilenceMs = 1000;

// PocketSphinx's log sink is one process-wide setting; builds of two
// instances at once must not race on it.
std::mutex log_setup_mutex;

// Filler words (sentence marks, silence, noises) are written <...>, [...] or
// ++...++ in the dictionaries PocketSphinx reads; they are not recognised
// words and carry no confidence worth averaging.
bool IsFillerWord(const char* word) { return word[0] == '<' || word[0] == '[' || word[0] == '+'; }

bool IsKnownOption(const std::string& name) {
  const std::string flag = "-" + name;
  for (const arg_t* arg = ps_args(); arg->name != nullptr; ++arg) {
    if (flag == arg->name) return true;
  }
  return false;
}

// Marks the recogniser busy in a callback, also when the callback throws.
class CallbackScope {
 public:
  explicit CallbackScope(int* depth) : depth_(depth) { ++*depth_; }
  ~CallbackScope() { --*depth_; }
  CallbackScope(const CallbackScope&) = delete;
  CallbackScope& operator=(const CallbackScope&) = delete;

 private:
  int* const depth_;
};

// The search that a grammar from the manifest becomes.
constexpr char kGrammarSearch[] = "grammar";

// Line (from 1) where `word` first stands as a word of a rule's expansion in
// the JSGF text, or 0. Rule names <...>, tags {...}, weights /.../ and
// comments are not words; quotes make one word of what they hold.
int LineOfWord(const std::string& text, const std::string& word) {
  int line = 1;
  bool in_expansion = false;  // between a rule's '=' and its ';'
  const auto skip_to = [&](size_t* i, const char* end) {
    const size_t stop = text.find(end, *i);
    const size_t until = stop == std::string::npos ? text.size() : stop + strlen(end);
    line += static_cast<int>(std::count(text.begin() + *i, text.begin() + until, '\n'));
    *i = until;
  };
  for (size_t i = 0; i < text.size();) {
    const char c = text[i];
    if (text.compare(i, 2, "//") == 0) {
      skip_to(&i, "\n");
    } else if (text.compare(i, 2, "/*") == 0) {
      skip_to(&i, "*/");
    } else if (c == '<') {
      skip_to(&i, ">");
    } else if (c == '{') {
      skip_to(&i, "}");
    } else if (c == '/' && in_expansion) {
      ++i;
      skip_to(&i, "/");
    } else if (c == '=' || c == ';') {
      in_expansion = c == '=';
      ++i;
    } else if (c == '"') {
      const size_t close = text.find('"', i + 1);
      const size_t end = close == std::string::npos ? text.size() : close;
      if (in_expansion && text.compare(i + 1, end - i - 1, word) == 0) return line;
      ++i;
      skip_to(&i, "\"");
    } else if (std::isspace(static_cast<unsigned char>(c)) || std::strchr("|*+()[]", c)) {
      if (c == '\n') ++line;
      ++i;
    } else {
      const size_t end = text.find_first_of(" \t\r\n;=|*+()[]<>{}/\"", i);
      const size_t stop = end == std::string::npos ? text.size() : end;
      if (in_expansion && text.compare(i, stop - i, word) == 0) return line;
      i = stop;
    }
  }
  return 0;
}

// Turns the JSGF file into the recogniser's search, after checking that the
// dictionary knows every word: PocketSphinx alone would refuse the grammar
// naming neither the word nor where it is.
bool UseGrammar(ps_decoder_t* ps, const std::string& path) {
  jsgf_t* grammar = jsgf_parse_file(path.c_str(), nullptr);
  if (grammar == nullptr) {
    ReportError("grammar \"" + path +
                "\" is not valid JSGF (\"log = stderr\" in the manifest shows where)");
    return false;
  }
  jsgf_rule_t* rule = jsgf_get_public_rule(grammar);
  if (rule == nullptr) {
    ReportError("grammar \"" + path + "\" has no public rule");
    jsgf_grammar_free(grammar);
    return false;
  }
  fsg_model_t* fsg =
      jsgf_build_fsg(grammar, rule, ps_get_logmath(ps), cmd_ln_float32_r(ps_get_config(ps), "-lw"));
  jsgf_grammar_free(grammar);
  for (int id = 0; id < fsg_model_n_word(fsg); ++id) {
    const std::string word = fsg_model_word_str(fsg, id);
    char* pronunciation = ps_lookup_word(ps, word.c_str());
    if (pronunciation != nullptr) {
      ckd_free(pronunciation);
      continue;
    }
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    const int line = LineOfWord(text.str(), word);
    ReportError("grammar \"" + path + "\"" + (line > 0 ? " line " + std::to_string(line) : "") +
                ": word \"" + word + "\" is not in the dictionary");
    fsg_model_free(fsg);
    return false;
  }
  // The search keeps its own reference to the model.
  const bool used =
      ps_set_fsg(ps, kGrammarSearch, fsg) == 0 && ps_set_search(ps, kGrammarSearch) == 0;
  fsg_model_free(fsg);
  if (!used) ReportError("the recogniser could not use grammar \"" + path + "\"");
  return used;
}

}  // namespace

std::unique_ptr<Recognizer> Recognizer::Create(const ModelSettings& settings) {
  // Parsed as a command line, whose first word names the program.
  std::vector<std::string> args = {"kvasr_decoder", "-hmm", settings.acoustic_model_dir, "-dict",
                                   settings.dictionary};
  if (!settings.filler_dictionary.empty()) {
    args.insert(args.end(), {"-fdict", settings.filler_dictionary});
  }
  // A grammar is set up once the dictionary is loaded, to check its words.
  if (!settings.language_model.empty()) {
    args.insert(args.end(), {"-lm", settings.language_model});
  }
  for (const auto& [name, value] : settings.options) {
    if (!IsKnownOption(name)) {
      ReportError("unknown recogniser option \"" + name + "\" in the model manifest");
      return nullptr;
    }
    args.insert(args.end(), {"-" + name, value});
  }
  std::vector<char*> argv;
  for (std::string& arg : args) argv.push_back(arg.data());

  std::lock_guard<std::mutex> lock(log_setup_mutex);
  err_set_logfp(settings.log_to_stderr ? stderr : nullptr);
  cmd_ln_t* config =
      cmd_ln_parse_r(nullptr, ps_args(), static_cast<int32>(argv.size()), argv.data(), TRUE);
  if (config == nullptr) {
    ReportError("the recogniser rejected an option value in the model manifest");
    return nullptr;
  }
  ps_decoder_t* ps = ps_init(config);
  // The decoder keeps its own reference to the configuration.
  cmd_ln_free_r(config);
  if (ps == nullptr) {
    ReportError(
        "the recogniser could not load the model named in the manifest "
        "(\"log = stderr\" in the manifest shows why)");
    return nullptr;
  }
  if (!settings.grammar.empty() && !UseGrammar(ps, settings.grammar)) {
    ps_free(ps);
    return nullptr;
  }
  cmd_ln_t* used = ps_get_config(ps);
  const int32 frame_rate = cmd_ln_int32_r(used, "-frate");
  const int32 hangover_frames = cmd_ln_int32_r(used, "-vad_postspeech");
  if (frame_rate <= 0 || frame_rate > kSampleRateHz) {
    ReportError("recogniser option frate must be between 1 and 16000");
    ps_free(ps);
    return nullptr;
  }
  const int64_t frame_shift_samples = kSampleRateHz / frame_rate;
  return std::unique_ptr<Recognizer>(
      new Recognizer(ps, frame_shift_samples, hangover_frames * frame_shift_samples));
}

Recognizer::Recognizer(ps_decoder_t* ps, int64_t frame_shift_samples, int64_t hangover_samples)
    : ps_(ps), frame_shift_samples_(frame_shift_samples), detector_(hangover_samples) {
  SetSpeechEndLimits(kDefaultLeadingSilenceMs, kDefaultTrailingSilenceMs);
}

Recognizer::~Recognizer() {
  // An unfinished utterance is dropped without a result.
  if (utterance_active_) ps_end_utt(ps_);
  ps_free(ps_);
}

int Recognizer::SetSpeechEndLimits(int32_t leading_silence_ms, int32_t trailing_silence_ms) {
  if (leading_silence_ms < 0 || trailing_silence_ms < 0) return KVASR_DECODER_ERR_ARGUMENT;
  detector_.SetLimits(leading_silence_ms * kSamplesPerMs, trailing_silence_ms * kSamplesPerMs);
  return 0;
}

int Recognizer::Start() {
  if (InCallback()) return KVASR_DECODER_ERR_BUSY;
  if (utterance_active_) {
    // Starting over drops the unfinished utterance without a result, since
    // results are delivered only from feeding and stopping.
    ps_end_utt(ps_);
    utterance_active_ = false;
  }
  return BeginUtterance();
}

int Recognizer::Feed(const int16_t* samples, int64_t count, bool last) {
  if (count < 0 || count > kMaxChunkSamples || (count > 0 && samples == nullptr)) {
    return KVASR_DECODER_ERR_ARGUMENT;
  }
  if (InCallback()) return KVASR_DECODER_ERR_BUSY;
  for (int64_t done = 0; done < count;) {
    // After an automatic stop the rest of the chunk opens the next utterance.
    if (!utterance_active_) {
      const int started = BeginUtterance();
      if (started < 0) return started;
    }
    const int64_t piece = std::min(frame_shift_samples_, count - done);
    if (ps_process_raw(ps_, samples + done, static_cast<size_t>(piece), FALSE, FALSE) < 0) {
      return KVASR_DECODER_ERR_RECOGNISER;
    }
    done += piece;
    if (!speech_end_enabled_) continue;
    const int reason = detector_.Update(ps_get_in_speech(ps_) != 0, piece);
    if (reason == 0) continue;
    DeliverSpeechEnd(reason);
    if (auto_stop_) FinishUtterance();
    if (destroy_requested_) return 0;
  }
  if (!utterance_active_) return 0;
  if (last) {
    FinishUtterance();
  } else {
    DeliverPartial();
  }
  return 0;
}

int Recognizer::Stop() {
  if (InCallback()) return KVASR_DECODER_ERR_BUSY;
  if (utterance_active_) FinishUtterance();
  return 0;
}

int Recognizer::BeginUtterance() {
  if (ps_start_utt(ps_) < 0) return KVASR_DECODER_ERR_RECOGNISER;
  utterance_active_ = true;
  detector_.Reset();
  last_partial_.clear();
  return 0;
}

void Recognizer::FinishUtterance() {
  utterance_active_ = false;
  // A failed end still leaves the best hypothesis so far, and every
  // utterance gets exactly one final result.
  ps_end_utt(ps_);
  int32 best_score;
  const char* text = ps_get_hyp(ps_, &best_score);
  if (text == nullptr) text = "";
  DeliverResult(text, text[0] == '\0' ? 0.0f : MeanWordPosterior(), 1);
}

void Recognizer::DeliverPartial() {
  int32 best_score;
  const char* text = ps_get_hyp(ps_, &best_score);
  if (text == nullptr || text[0] == '\0' || last_partial_ == text) return;
  last_partial_ = text;
  DeliverResult(text, KVASR_DECODER_SCORE_UNAVAILABLE, 0);
}

void Recognizer::DeliverResult(const char* text, float score, int flag) {
  if (on_result_ == nullptr || destroy_requested_) return;
  CallbackScope scope(&callback_depth_);
  on_result_(text, score, flag, out_handle_);
}

void Recognizer::DeliverSpeechEnd(int reason) {
  if (on_speech_end_ == nullptr || destroy_requested_) return;
  CallbackScope scope(&callback_depth_);
  on_speech_end_(reason, out_handle_);
}

float Recognizer::MeanWordPosterior() {
  logmath_t* log_math = ps_get_logmath(ps_);
  double sum = 0.0;
  int words = 0;
  // Iterating to the end frees the iterator.
  for (ps_seg_t* seg = ps_seg_iter(ps_); seg != nullptr; seg = ps_seg_next(seg)) {
    if (IsFillerWord(ps_seg_word(seg))) continue;
    int32 acoustic_score, language_score, backoff;
    sum += logmath_exp(log_math, ps_seg_prob(seg, &acoustic_score, &language_score, &backoff));
    ++words;
  }
  return words == 0 ? 0.0f : static_cast<float>(sum / words);
}

}  // namespace kvasr::decoder
