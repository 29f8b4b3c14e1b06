#include "punct_test_support.h"

namespace kvasr {
namespace punct {
namespace test {

ModelFiles FilesIn(const std::string& dir) {
  const std::string d = dir + "/";
  return ModelFiles{d + "model.bin", d + "vocab.txt", d + "punc.txt", d + "num.txt",
                    d + "case.txt",  d + "xdb.txt",   d + "bpe.txt"};
}

std::unique_ptr<Punctuator> LoadModelDir(const std::string& dir, std::string* error) {
  return Punctuator::Create(FilesIn(dir), "en", error);
}

}  // namespace test
}  // namespace punct
}  // namespace kvasr
