#include "model_paths.h"

#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

namespace kvasr_cli {
namespace {

std::string ExecutableDir() {
  char buffer[PATH_MAX];
  const ssize_t n = readlink("/proc/self/exe", buffer, sizeof buffer - 1);
  if (n <= 0) return std::string();
  const std::string exe(buffer, static_cast<size_t>(n));
  return exe.substr(0, exe.find_last_of('/'));
}

}  // namespace

bool IsFile(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

bool IsDirectory(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

std::string DefaultModelsDir() {
  // Installed: found from the executable, so a moved or unpacked prefix works.
  const std::string installed = ExecutableDir() + "/" KVASR_MODELS_FROM_BINDIR;
  if (IsDirectory(installed + "/decoder")) return installed;
  // Build tree: the source checkout's models folder.
  const std::string source = KVASR_SOURCE_MODELS_DIR;
  if (IsDirectory(source + "/decoder")) return source;
  return std::string();
}

std::string ResolveAgainst(const std::string& base_dir, const std::string& path) {
  if (path.empty() || path[0] == '/') return path;
  return base_dir + "/" + path;
}

}  // namespace kvasr_cli
