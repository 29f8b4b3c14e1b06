// SPDX-License-Identifier: Apache-2.0
// Where the default models are: next to the build tree, or under the install
// prefix relative to the executable.
#ifndef KVASR_TOOLS_KVASR_MODEL_PATHS_H_
#define KVASR_TOOLS_KVASR_MODEL_PATHS_H_

#include <string>

namespace kvasr_cli {

// The models folder holding decoder/, vad/ and punct/, or "" when none is found.
std::string DefaultModelsDir();

// `path` made absolute against `base_dir` unless it is absolute or empty.
std::string ResolveAgainst(const std::string& base_dir, const std::string& path);

}  // namespace kvasr_cli

#endif  // KVASR_TOOLS_KVASR_MODEL_PATHS_H_
