#ifndef KVASR_TESTS_PUNCTUATOR_PUNCT_TEST_SUPPORT_H_
#define KVASR_TESTS_PUNCTUATOR_PUNCT_TEST_SUPPORT_H_

#include <memory>
#include <string>

#include "punctuator.h"

namespace kvasr {
namespace punct {
namespace test {

// The seven files of a model folder by their usual names.
ModelFiles FilesIn(const std::string& dir);
std::unique_ptr<Punctuator> LoadModelDir(const std::string& dir, std::string* error);

}  // namespace test
}  // namespace punct
}  // namespace kvasr

#endif  // KVASR_TESTS_PUNCTUATOR_PUNCT_TEST_SUPPORT_H_
