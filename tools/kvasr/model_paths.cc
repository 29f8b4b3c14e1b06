// SPDX-License-Identifier: Apache-2.0
#include "model_paths.h"

#include <limits.h>
#include <unistd.h>

#include "file_kind.h"

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

std::string DefaultModelsDir() {
  // Installed: found from the executable, so a moved or unpacked prefix works.
  const std::string installed = ExecutableDir() + "/" KVASR_MODELS_FROM_BINDIR;
  if (kvasr_common::IsDirectory(installed + "/decoder")) return installed;
  // Build tree: the source checkout's models folder.
  const std::string source = KVASR_SOURCE_MODELS_DIR;
  if (kvasr_common::IsDirectory(source + "/decoder")) return source;
  return std::string();
}

std::string ResolveAgainst(const std::string& base_dir, const std::string& path) {
  if (path.empty() || path[0] == '/') return path;
  return base_dir + "/" + path;
}

}  // namespace kvasr_cli
