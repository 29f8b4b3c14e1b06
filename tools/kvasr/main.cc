// SPDX-License-Identifier: Apache-2.0
// kvasr: command-line front end of the offline recogniser.
#include <fcntl.h>
#include <getopt.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "kvasr_offline.h"
#include "pitch_command.h"
#include "transcribe.h"
#include "vad_command.h"

namespace {

constexpr char kUsage[] =
    "usage: kvasr transcribe [options] FILE...\n"
    "       kvasr vad [vad options] FILE...\n"
    "       kvasr pitch FILE\n"
    "       kvasr --version\n"
    "\n"
    "Transcribes WAV, FLAC or OGG files (any rate and channel count), or raw\n"
    "sound from standard input for '-' (a container such as WAV is recognised by\n"
    "its header; anything else is taken as raw 16 kHz 16-bit mono little-endian).\n"
    "Prints the final texts, one per line (prefixed by the file name and a tab\n"
    "when several inputs are given). Below 16 kHz a warning says that accuracy\n"
    "will suffer.\n"
    "\n"
    "options:\n"
    "  --model FILE            decoder model manifest (default: the shipped en-us one)\n"
    "  --grammar FILE.gram     JSGF grammar in place of the model's language model: only\n"
    "                          what it allows is recognised\n"
    "  --vad-models DIR        VAD model folder (default: the shipped one)\n"
    "  --no-vad                feed all sound to the decoder\n"
    "  --punct                 punctuate final texts with the shipped English model\n"
    "  --punct-settings FILE   punctuation settings (JSON object of local_punc_settings)\n"
    "  --lang CODE             language code (default en-US)\n"
    "  --json                  print every result message as one JSON object per line,\n"
    "                          its input named in the field \"input\"\n"
    "  --chunk-ms N            milliseconds of sound per call (default 100)\n"
    "  --max-silence-before-ms N, --max-silence-after-ms N\n"
    "                          end listening after this much silence (VAD on; 0: never)\n"
    "  --no-progress           no progress bar\n"
    "  --verbose               show the library's log on standard error\n"
    "\n"
    "kvasr vad prints the speech segments that the voice activity detector\n"
    "emits, start and end in seconds, one per line.\n"
    "\n"
    "vad options:\n"
    "  --vad-models DIR        VAD model folder (default: the shipped one)\n"
    "  --chunk-ms N            milliseconds of sound per call (default 100)\n"
    "  --frames                one line per 10 ms frame instead: index, decision (0/1),\n"
    "                          smoothed score, in an emitted segment (0/1)\n"
    "  --plot OUT.png          draw waveform, smoothed score and segments (one input)\n"
    "  --dump DIR              write DIR/<name>.f32 (the network's input rows, 39\n"
    "                          floats a frame), <name>.tsv (per-frame record) and\n"
    "                          <name>.stats (running normalisation statistics)\n"
    "  --verbose               show the module's log on standard error\n"
    "\n"
    "kvasr pitch prints the raw pitch track of one recording: frame index and\n"
    "frequency in Hz (0: unvoiced), one line per 10 ms frame, after a '#' line\n"
    "that gives the time of each frame.\n";

enum Option {
  kModel = 256,
  kGrammar,
  kVadModels,
  kNoVad,
  kPunct,
  kPunctSettings,
  kLang,
  kJson,
  kChunkMs,
  kSilenceBefore,
  kSilenceAfter,
  kNoProgress,
  kVerbose,
  kHelp
};

bool ParseInt(const char* text, long min, long max, long* out) {
  errno = 0;
  char* end = nullptr;
  const long v = std::strtol(text, &end, 10);
  if (errno != 0 || end == text || *end != '\0' || v < min || v > max) return false;
  *out = v;
  return true;
}

bool ParseChunkMs(const char* text, int* chunk_ms) {
  long n = 0;
  if (!ParseInt(text, 1, 60000, &n)) {
    std::fprintf(stderr, "kvasr: --chunk-ms takes milliseconds from 1 to 60000\n");
    return false;
  }
  *chunk_ms = static_cast<int>(n);
  return true;
}

// What ParseCommandLine returns when the subcommand is to run.
constexpr int kRun = -1;

// Reads one subcommand's options, then the inputs after them. `apply` takes
// every option but `help` and returns false, having said why, to refuse it.
// Returns kRun, or the status to exit with: 0 after the usage that `help`
// asks for, 2 after an unknown option, a refused one or no input.
template <typename Apply>
int ParseCommandLine(int argc, char** argv, const struct option* options, int help, Apply apply,
                     std::vector<std::string>* inputs) {
  int c;
  while ((c = getopt_long(argc, argv, "", options, nullptr)) != -1) {
    if (c == help) {
      std::fputs(kUsage, stdout);
      return 0;
    }
    if (c == '?') {
      std::fputs(kUsage, stderr);
      return 2;
    }
    if (!apply(c)) return 2;
  }
  for (int i = optind; i < argc; ++i) inputs->push_back(argv[i]);
  if (!inputs->empty()) return kRun;
  std::fputs("kvasr: no input given\n", stderr);
  std::fputs(kUsage, stderr);
  return 2;
}

// The library logs on standard output; keep that stream for the texts and
// send the log to standard error, or nowhere.
FILE* TakeStdoutForResults(bool verbose) {
  std::fflush(stdout);
  const int results_fd = dup(STDOUT_FILENO);
  const int log_fd = verbose ? dup(STDERR_FILENO) : open("/dev/null", O_WRONLY);
  if (results_fd < 0 || log_fd < 0) return stdout;
  dup2(log_fd, STDOUT_FILENO);
  close(log_fd);
  return fdopen(results_fd, "w");
}

int Transcribe(int argc, char** argv) {
  static const struct option kOptions[] = {
      {"model", required_argument, nullptr, kModel},
      {"grammar", required_argument, nullptr, kGrammar},
      {"vad-models", required_argument, nullptr, kVadModels},
      {"no-vad", no_argument, nullptr, kNoVad},
      {"punct", no_argument, nullptr, kPunct},
      {"punct-settings", required_argument, nullptr, kPunctSettings},
      {"lang", required_argument, nullptr, kLang},
      {"json", no_argument, nullptr, kJson},
      {"chunk-ms", required_argument, nullptr, kChunkMs},
      {"max-silence-before-ms", required_argument, nullptr, kSilenceBefore},
      {"max-silence-after-ms", required_argument, nullptr, kSilenceAfter},
      {"no-progress", no_argument, nullptr, kNoProgress},
      {"verbose", no_argument, nullptr, kVerbose},
      {"help", no_argument, nullptr, kHelp},
      {nullptr, 0, nullptr, 0}};
  kvasr_cli::TranscribeOptions o;
  bool verbose = false;
  const auto apply = [&](int c) {
    long n = 0;
    switch (c) {
      case kModel: o.decoder_model = optarg; break;
      case kGrammar: o.grammar = optarg; break;
      case kVadModels: o.vad_dir = optarg; break;
      case kNoVad: o.vad = false; break;
      case kPunct: o.punct = true; break;
      case kPunctSettings:
        o.punct = true;
        o.punct_settings = optarg;
        break;
      case kLang: o.lang = optarg; break;
      case kJson: o.json = true; break;
      case kNoProgress: o.progress = false; break;
      case kVerbose: verbose = true; break;
      case kChunkMs: return ParseChunkMs(optarg, &o.chunk_ms);
      case kSilenceBefore:
      case kSilenceAfter:
        // The engine counts in 32-bit samples: 16 per millisecond.
        if (!ParseInt(optarg, 0, UINT32_MAX / 16, &n)) {
          std::fprintf(stderr, "kvasr: silence limits take milliseconds from 0 to %u\n",
                       UINT32_MAX / 16);
          return false;
        }
        (c == kSilenceBefore ? o.max_silence_before_ms : o.max_silence_after_ms) =
            static_cast<uint32_t>(n);
        break;
    }
    return true;
  };
  const int status = ParseCommandLine(argc, argv, kOptions, kHelp, apply, &o.inputs);
  if (status != kRun) return status;
  return kvasr_cli::RunTranscribe(o, TakeStdoutForResults(verbose));
}

int Vad(int argc, char** argv) {
  enum VadOption { kVadDir = 256, kVadChunkMs, kFrames, kPlot, kDump, kVadVerbose, kVadHelp };
  static const struct option kOptions[] = {{"vad-models", required_argument, nullptr, kVadDir},
                                           {"chunk-ms", required_argument, nullptr, kVadChunkMs},
                                           {"frames", no_argument, nullptr, kFrames},
                                           {"plot", required_argument, nullptr, kPlot},
                                           {"dump", required_argument, nullptr, kDump},
                                           {"verbose", no_argument, nullptr, kVadVerbose},
                                           {"help", no_argument, nullptr, kVadHelp},
                                           {nullptr, 0, nullptr, 0}};
  kvasr_cli::VadOptions o;
  bool verbose = false;
  const auto apply = [&](int c) {
    switch (c) {
      case kVadDir: o.vad_dir = optarg; break;
      case kFrames: o.frames = true; break;
      case kPlot: o.plot_path = optarg; break;
      case kDump: o.dump_dir = optarg; break;
      case kVadVerbose: verbose = true; break;
      case kVadChunkMs: return ParseChunkMs(optarg, &o.chunk_ms);
    }
    return true;
  };
  const int status = ParseCommandLine(argc, argv, kOptions, kVadHelp, apply, &o.inputs);
  if (status != kRun) return status;
  return kvasr_cli::RunVadCommand(o, TakeStdoutForResults(verbose));
}

int Pitch(int argc, char** argv) {
  if (argc == 2 && std::strcmp(argv[1], "--help") == 0) {
    std::fputs(kUsage, stdout);
    return 0;
  }
  if (argc != 2 || argv[1][0] == '\0') {
    std::fputs("kvasr: pitch takes one input file\n", stderr);
    std::fputs(kUsage, stderr);
    return 2;
  }
  return kvasr_cli::RunPitchCommand(argv[1], TakeStdoutForResults(false));
}

}  // namespace

int main(int argc, char** argv) {
  const std::string command = argc > 1 ? argv[1] : "";
  if (command == "transcribe") return Transcribe(argc - 1, argv + 1);
  if (command == "vad") return Vad(argc - 1, argv + 1);
  if (command == "pitch") return Pitch(argc - 1, argv + 1);
  if (command == "--version" || command == "version") {
    std::printf("kvasr %s\ndecoder: %s\n", KVASR_VERSION, vorta_speech_get_offline_asr_version());
    return 0;
  }
  if (command == "-h" || command == "--help" || command == "help") {
    std::fputs(kUsage, stdout);
    return 0;
  }
  std::fputs(kUsage, stderr);
  return 2;
}
