// SPDX-License-Identifier: Apache-2.0
#include "manifest.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <map>

#include "file_kind.h"
#include "kvasr_decoder_constants.h"

namespace kvasr::decoder {
namespace {

// A manifest is a dozen lines; anything much larger is some other file.
constexpr size_t kMaxManifestBytes = 64 * 1024;

// Bases of bases are allowed, but a chain this long is a loop.
constexpr int kMaxBaseDepth = 8;

constexpr char kOptionPrefix[] = "option.";

// Options that the manifest's own keys set, or that this library fixes
// (16 kHz input, logging), so that a manifest cannot contradict itself.
constexpr const char* kReservedOptions[] = {"hmm",      "dict",  "fdict",   "lm",  "lmctl",
                                            "lmname",   "jsgf",  "fsg",     "kws", "keyphrase",
                                            "allphone", "logfn", "samprate"};

// Files the recogniser's acoustic model loader needs, checked here so that
// a missing one is named: the loader fails without saying which, and ends
// the whole process when the mixture weights are missing.
constexpr const char* kAcousticModelFiles[] = {"mdef", "means", "variances", "transition_matrices"};
// Mixture weights come in one of two forms.
constexpr const char* kMixtureWeightFiles[] = {"sendump", "mixture_weights"};

std::string Trim(const std::string& s) {
  const char* kSpace = " \t\r";
  const size_t first = s.find_first_not_of(kSpace);
  if (first == std::string::npos) return "";
  return s.substr(first, s.find_last_not_of(kSpace) - first + 1);
}

// Path of the file behind `file`, or nothing. Only a FILE* is given, so the
// path is recovered through /proc; it is trusted only if it still names the
// very same file (not one that replaced it, nor a deleted one).
std::optional<std::string> PathOf(FILE* file) {
  const int fd = fileno(file);
  if (fd < 0) return std::nullopt;
  const std::string link = "/proc/self/fd/" + std::to_string(fd);
  char buffer[4096];
  const ssize_t length = readlink(link.c_str(), buffer, sizeof buffer);
  if (length <= 0 || static_cast<size_t>(length) >= sizeof buffer || buffer[0] != '/') {
    return std::nullopt;
  }
  const std::string path(buffer, static_cast<size_t>(length));
  struct stat by_fd;
  struct stat by_path;
  if (fstat(fd, &by_fd) != 0 || stat(path.c_str(), &by_path) != 0 ||
      by_fd.st_dev != by_path.st_dev || by_fd.st_ino != by_path.st_ino) {
    return std::nullopt;
  }
  return path;
}

std::optional<ModelSettings> ReadFrom(FILE* file, const std::optional<std::string>& path,
                                      int depth);

class Parser {
 public:
  Parser(std::optional<std::string> manifest_path, int depth)
      : manifest_path_(std::move(manifest_path)), depth_(depth) {
    if (manifest_path_) {
      manifest_dir_ = manifest_path_->substr(0, manifest_path_->rfind('/') + 1);
    }
  }

  std::optional<ModelSettings> Parse(const std::string& text) {
    if (text.find('\0') != std::string::npos) {
      return Fail(0, "not a text file");
    }
    size_t start = 0;
    int line_number = 0;
    bool tag_seen = false;
    while (start < text.size()) {
      size_t end = text.find('\n', start);
      if (end == std::string::npos) end = text.size();
      const std::string line = Trim(text.substr(start, end - start));
      start = end + 1;
      ++line_number;
      if (!tag_seen) {
        if (!CheckTag(line, line_number)) return std::nullopt;
        tag_seen = true;
        continue;
      }
      if (line.empty() || line[0] == '#') continue;
      if (!ReadEntry(line, line_number)) return std::nullopt;
    }
    if (!tag_seen) return Fail(0, "empty file");
    return Complete();
  }

 private:
  std::nullopt_t Fail(int line_number, const std::string& message) const {
    std::string where = "model manifest " + manifest_path_.value_or("(path unknown)");
    if (line_number > 0) where += " line " + std::to_string(line_number);
    ReportError(where + ": " + message);
    return std::nullopt;
  }

  bool CheckTag(const std::string& line, int line_number) {
    const std::string tag = KVASR_DECODER_MANIFEST_TAG;
    if (line.compare(0, tag.size(), tag) != 0 ||
        (line.size() > tag.size() && line[tag.size()] != ' ')) {
      Fail(line_number, "first line must be \"" + tag + " " +
                            std::to_string(KVASR_DECODER_MANIFEST_VERSION) + "\"");
      return false;
    }
    const std::string version = Trim(line.substr(tag.size()));
    if (version != std::to_string(KVASR_DECODER_MANIFEST_VERSION)) {
      Fail(line_number, "unsupported format version \"" + version +
                            "\" (this library reads version " +
                            std::to_string(KVASR_DECODER_MANIFEST_VERSION) + ")");
      return false;
    }
    return true;
  }

  bool ReadEntry(const std::string& line, int line_number) {
    const size_t equals = line.find('=');
    if (equals == std::string::npos) {
      Fail(line_number, "expected \"key = value\"");
      return false;
    }
    const std::string key = Trim(line.substr(0, equals));
    const std::string value = Trim(line.substr(equals + 1));
    if (key.empty() || value.empty()) {
      Fail(line_number, "expected \"key = value\"");
      return false;
    }
    if (!entries_.emplace(key, Entry{value, line_number}).second) {
      Fail(line_number, "key \"" + key + "\" given twice");
      return false;
    }
    if (key.compare(0, strlen(kOptionPrefix), kOptionPrefix) == 0) {
      const std::string name = key.substr(strlen(kOptionPrefix));
      for (const char* reserved : kReservedOptions) {
        if (name == reserved) {
          Fail(line_number, "option \"" + name +
                                "\" is set by this library "
                                "or by a manifest key, not as an option");
          return false;
        }
      }
      if (name.empty()) {
        Fail(line_number, "option without a name");
        return false;
      }
      settings_.options.emplace_back(name, value);
      return true;
    }
    static const char* const kKnownKeys[] = {"acoustic_model",
                                             "dictionary",
                                             "filler_dictionary",
                                             "language_model",
                                             "grammar",
                                             "log",
                                             "base"};
    for (const char* known : kKnownKeys) {
      if (key == known) return true;
    }
    Fail(line_number, "unknown key \"" + key + "\"");
    return false;
  }

  // Resolves the value of `key` to a path; empty if the key is absent.
  // False (after reporting) if the path cannot be made.
  bool Resolve(const std::string& key, std::string* path) const {
    const auto it = entries_.find(key);
    if (it == entries_.end()) return true;
    const std::string& value = it->second.value;
    if (value[0] == '/') {
      *path = value;
      return true;
    }
    if (!manifest_path_) {
      Fail(it->second.line, "relative path \"" + value +
                                "\" but the manifest's own location cannot be "
                                "found; use absolute paths");
      return false;
    }
    *path = manifest_dir_ + value;
    return true;
  }

  bool ResolveFile(const std::string& key, std::string* path) const {
    if (!Resolve(key, path)) return false;
    if (!path->empty() && !kvasr_common::IsFile(*path)) {
      Fail(entries_.at(key).line, key + " \"" + *path + "\" is not a readable file");
      return false;
    }
    return true;
  }

  std::optional<ModelSettings> Complete() {
    const bool has_base = entries_.count("base") > 0;
    if (!has_base) {
      for (const char* required : {"acoustic_model", "dictionary"}) {
        if (entries_.count(required) == 0) {
          return Fail(0, std::string("missing key \"") + required + "\"");
        }
      }
    }
    const size_t models = entries_.count("language_model") + entries_.count("grammar");
    if (models > 1 || (models == 0 && !has_base)) {
      return Fail(0, "exactly one of \"language_model\" and \"grammar\" is needed");
    }
    std::vector<std::pair<std::string, std::string>> own_options = std::move(settings_.options);
    settings_ = ModelSettings();
    if (has_base) {
      std::optional<ModelSettings> base = ReadBase();
      if (!base) return std::nullopt;
      settings_ = *std::move(base);
    }
    // What this manifest names replaces what its base names.
    if (models == 1) {
      settings_.language_model.clear();
      settings_.grammar.clear();
    }
    if ((entries_.count("acoustic_model") > 0 &&
         (!Resolve("acoustic_model", &settings_.acoustic_model_dir) || !CheckAcousticModel())) ||
        !ResolveFile("dictionary", &settings_.dictionary) ||
        !ResolveFile("filler_dictionary", &settings_.filler_dictionary) ||
        !ResolveFile("language_model", &settings_.language_model) ||
        !ResolveFile("grammar", &settings_.grammar)) {
      return std::nullopt;
    }
    const auto log = entries_.find("log");
    if (log != entries_.end()) {
      if (log->second.value != "off" && log->second.value != "stderr") {
        return Fail(log->second.line, "log must be \"off\" or \"stderr\"");
      }
      settings_.log_to_stderr = log->second.value == "stderr";
    }
    for (auto& own : own_options) {
      auto& options = settings_.options;
      options.erase(
          std::remove_if(options.begin(), options.end(),
                         [&own](const auto& option) { return option.first == own.first; }),
          options.end());
      options.push_back(std::move(own));
    }
    return settings_;
  }

  // The settings of the manifest named by "base", whose own paths are taken
  // from its own folder. Its faults are reported by its own parser.
  std::optional<ModelSettings> ReadBase() const {
    std::string path;
    if (!ResolveFile("base", &path)) return std::nullopt;
    const int line = entries_.at("base").line;
    if (depth_ >= kMaxBaseDepth) {
      return Fail(line, "bases nested more than " + std::to_string(kMaxBaseDepth) +
                            " deep (does a manifest name itself?)");
    }
    FILE* file = fopen(path.c_str(), "rb");
    if (file == nullptr) return Fail(line, "base \"" + path + "\": " + strerror(errno));
    std::optional<ModelSettings> base = ReadFrom(file, path, depth_ + 1);
    fclose(file);
    return base;
  }

  bool CheckAcousticModel() const {
    const std::string& dir = settings_.acoustic_model_dir;
    const int line = entries_.at("acoustic_model").line;
    if (!kvasr_common::IsDirectory(dir)) {
      Fail(line, "acoustic_model \"" + dir + "\" is not a directory");
      return false;
    }
    for (const char* name : kAcousticModelFiles) {
      if (!kvasr_common::IsFile(dir + "/" + name)) {
        Fail(line, "acoustic model \"" + dir + "\" has no file \"" + name + "\"");
        return false;
      }
    }
    for (const char* name : kMixtureWeightFiles) {
      if (kvasr_common::IsFile(dir + "/" + name)) return true;
    }
    Fail(line, "acoustic model \"" + dir +
                   "\" has neither \"sendump\" nor "
                   "\"mixture_weights\"");
    return false;
  }

  struct Entry {
    std::string value;
    int line;
  };

  const std::optional<std::string> manifest_path_;
  const int depth_;           // 0 for the manifest given, 1 for its base, ...
  std::string manifest_dir_;  // with its trailing slash
  std::map<std::string, Entry> entries_;
  ModelSettings settings_;
};

std::optional<ModelSettings> ReadFrom(FILE* file, const std::optional<std::string>& path,
                                      int depth) {
  std::string text;
  char chunk[4096];
  size_t got;
  while ((got = fread(chunk, 1, sizeof chunk, file)) > 0) {
    text.append(chunk, got);
    if (text.size() > kMaxManifestBytes) {
      ReportError("model manifest " + path.value_or("(path unknown)") + ": larger than " +
                  std::to_string(kMaxManifestBytes) + " bytes, not a manifest");
      return std::nullopt;
    }
  }
  if (ferror(file)) {
    ReportError("model manifest " + path.value_or("(path unknown)") +
                ": read failed: " + strerror(errno));
    return std::nullopt;
  }
  return Parser(path, depth).Parse(text);
}

}  // namespace

void ReportError(const std::string& message) {
  fprintf(stderr, "kvasr_decoder: %s\n", message.c_str());
}

std::optional<ModelSettings> ReadManifest(FILE* file) {
  if (file == nullptr) {
    ReportError("no model manifest file given");
    return std::nullopt;
  }
  return ReadFrom(file, PathOf(file), 0);
}

}  // namespace kvasr::decoder
