// SPDX-License-Identifier: Apache-2.0
// The library through its three C functions, with the shipped English model.
#include <gtest/gtest.h>

#include <array>
#include <cctype>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <string>
#include <vector>

#include "allocation_counter.h"
#include "kvasr_punctuator_api.h"
#include "librivox.h"
#include "temp_dir.h"

namespace {

using kvasr_test::Words;

const std::string kModelDir = KVASR_PUNCT_MODEL_DIR;
const char* const kFileNames[] = {"model.bin", "vocab.txt", "punc.txt", "num.txt",
                                  "case.txt",  "xdb.txt",   "bpe.txt"};
enum FileIndex { kModel, kVocab, kPunc, kNum, kCase, kXdb, kBpe };
using Paths = std::array<std::string, 7>;

Paths PathsIn(const std::string& dir) {
  Paths paths;
  for (size_t i = 0; i < paths.size(); ++i) paths[i] = dir + "/" + kFileNames[i];
  return paths;
}

void* Init(const Paths& p, const char* lang = "en") {
  return punctuator_init(p[kModel].c_str(), p[kVocab].c_str(), p[kPunc].c_str(), p[kNum].c_str(),
                         p[kCase].c_str(), p[kXdb].c_str(), p[kBpe].c_str(), lang);
}

// Init that must fail; returns the one line it wrote on standard error.
std::string FailingInit(const Paths& paths, const char* lang = "en") {
  testing::internal::CaptureStderr();
  void* h = Init(paths, lang);
  const std::string err = testing::internal::GetCapturedStderr();
  EXPECT_EQ(h, nullptr);
  punctuator_relese(h);
  EXPECT_EQ(err.find('\n'), err.size() - 1) << err;
  return err;
}

std::string Punctuate(void* h, const std::string& text) {
  int32_t size = 0;
  if (punctuator_do_it(h, text.c_str(), nullptr, &size) == 0) return std::string();
  std::string out(static_cast<size_t>(size), '\0');
  EXPECT_EQ(punctuator_do_it(h, text.c_str(), &out[0], &size), 0);
  EXPECT_EQ(static_cast<size_t>(size), out.size());
  return out;
}

// A word of the output without its mark, in lower case.
std::string Bare(std::string w) {
  while (!w.empty() && (w.back() == ',' || w.back() == '.' || w.back() == '?')) w.pop_back();
  for (char& c : w) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return w;
}

class ModelTest : public testing::Test {
 protected:
  void SetUp() override { ASSERT_NE(handle_ = Init(PathsIn(kModelDir)), nullptr); }
  void TearDown() override { punctuator_relese(handle_); }
  void* handle_ = nullptr;
};

TEST_F(ModelTest, TooSmallBufferAsksForTheExactSizeAndChangesNothing) {
  const std::string text = "so what do you think about that i think it is great";
  const std::string full = Punctuate(handle_, text);
  ASSERT_FALSE(full.empty());
  const int32_t n = static_cast<int32_t>(full.size());
  const std::string untouched(static_cast<size_t>(n) + 8, '#');
  for (const int32_t capacity : {0, 1, n - 1, n, n + 8}) {
    SCOPED_TRACE(capacity);
    std::string buf = untouched;
    int32_t size = capacity;
    const bool fits = capacity >= n;
    EXPECT_EQ(punctuator_do_it(handle_, text.c_str(), &buf[0], &size), fits ? 0 : 1);
    EXPECT_EQ(size, n);
    EXPECT_EQ(buf, fits ? full + std::string(8, '#') : untouched);
  }
}

// Every word comes back byte for byte, whatever marks and capitals the
// input had, known to the model or not, and the text ends with a mark.
TEST_F(ModelTest, KeepsEveryWordAndMarksTheEnd) {
  const char* const texts[] = {
      "i went to the store and bought some bread then i went home",
      "the zorblaxian quantumflux hyperdrive was xqzt",
      "we met in a café in zürich with naïve señor łukasz and 東京 friends",
      "Hello, World. THIS is a Test?"};
  for (const char* text : texts) {
    SCOPED_TRACE(text);
    const std::vector<std::string> in = Words(text), out = Words(Punctuate(handle_, text));
    ASSERT_EQ(out.size(), in.size());
    for (size_t i = 0; i < in.size(); ++i) EXPECT_EQ(Bare(out[i]), Bare(in[i]));
    const char last = out.back().back();
    EXPECT_TRUE(last == '.' || last == '?') << out.back();
  }
  EXPECT_TRUE(std::isupper(static_cast<unsigned char>(Punctuate(handle_, texts[0])[0])));
}

// The features the model must get right on any sensible training.
TEST_F(ModelTest, PunctuatesCasesAndWritesNumbers) {
  const std::string out = Punctuate(
      handle_,
      "what do you think happened next i asked my friend john in new york and he said nothing");
  EXPECT_NE(out.find('?'), std::string::npos) << out;
  EXPECT_EQ(out.rfind("What ", 0), 0u) << out;
  EXPECT_NE(out.find(" I "), std::string::npos) << out;
  EXPECT_NE(out.find("New York"), std::string::npos) << out;
  const std::string numbers =
      Punctuate(handle_, "she was born in nineteen ninety five and has twenty three cats");
  EXPECT_NE(numbers.find(" 1995"), std::string::npos) << numbers;
  EXPECT_NE(numbers.find(" 23 cats"), std::string::npos) << numbers;
  EXPECT_EQ(Words(numbers).size(), 9u) << numbers;
}

TEST_F(ModelTest, EmptyAndBlankTextGiveEmptyOutput) {
  for (const char* text : {"", "   ", "\t\n", " . , ? "}) {
    int32_t size = 16;
    char buf[16];
    EXPECT_EQ(punctuator_do_it(handle_, text, buf, &size), 0) << '"' << text << '"';
    EXPECT_EQ(size, 0);
  }
}

TEST_F(ModelTest, VeryLongTextIsPunctuatedThroughout) {
  const std::vector<std::string> pool = Words(
      "we looked at the data and found that most people in the study were happy with their work "
      "but some of them said they wanted more time with family so we asked why");
  constexpr size_t kWords = 6000;
  const auto word = [&](size_t i) { return pool[(i * 7 + i / 13) % pool.size()]; };
  std::string text;
  for (size_t i = 0; i < kWords; ++i) text += word(i) + " ";
  const std::vector<std::string> words = Words(Punctuate(handle_, text));
  ASSERT_EQ(words.size(), kWords);
  size_t late_marks = 0;
  for (size_t i = 0; i < kWords; ++i) {
    ASSERT_EQ(Bare(words[i]), word(i)) << "word " << i;
    late_marks += i >= kWords - 500 && Bare(words[i]).size() != words[i].size();
  }
  // Not only in the first window.
  EXPECT_GT(late_marks, 5u);
}

TEST_F(ModelTest, AllocatesNothingOnceBuffersHaveGrownToTheLongestText) {
  const char* const texts[] = {
      "so what did you do in nineteen ninety five when you were twenty three years old and lived "
      "in paris",
      "we had three point five million people and one of them was called john",
      "ok",
  };
  char out[1024];
  int32_t size = sizeof out;
  ASSERT_EQ(punctuator_do_it(handle_, texts[0], out, &size), 0);
  const long before = kvasr_test::AllocationCount();
  for (const char* text : texts) {
    size = sizeof out;
    EXPECT_EQ(punctuator_do_it(handle_, text, out, &size), 0);
  }
  EXPECT_EQ(kvasr_test::AllocationCount() - before, 0);
}

TEST_F(ModelTest, BadArgumentsFail) {
  char buf[10];
  int32_t size = 10, negative = -1;
  for (int r : {punctuator_do_it(nullptr, "hello", buf, &size),
                punctuator_do_it(handle_, nullptr, buf, &size),
                punctuator_do_it(handle_, "hello", buf, nullptr),
                punctuator_do_it(handle_, "hello", nullptr, &size),
                punctuator_do_it(handle_, "hello", buf, &negative)}) {
    EXPECT_NE(r, 0);
    EXPECT_NE(r, 1);
  }
  punctuator_relese(nullptr);
}

TEST(ModelWithoutOptionalFiles, WorksAndLeavesNumbersInWords) {
  Paths paths = PathsIn(kModelDir);
  paths[kNum] = paths[kCase] = paths[kXdb] = "";
  void* h = Init(paths);
  ASSERT_NE(h, nullptr);
  const std::vector<std::string> out = Words(Punctuate(h, "there were twenty three of them"));
  ASSERT_EQ(out.size(), 6u);
  EXPECT_EQ(Bare(out[2]) + " " + Bare(out[3]), "twenty three");
  punctuator_relese(h);
}

// A copy of the shipped model in a temporary folder, to break.
class BrokenModelTest : public testing::Test {
 protected:
  void SetUp() override {
    paths_ = PathsIn(dir_.path());
    for (const char* name : kFileNames) {
      std::ifstream in(kModelDir + "/" + name, std::ios::binary);
      std::ofstream(dir_.path() + "/" + name, std::ios::binary) << in.rdbuf();
    }
    // Otherwise every refusal below could pass for the wrong reason.
    void* h = Init(paths_);
    ASSERT_NE(h, nullptr);
    punctuator_relese(h);
  }
  std::string Read(FileIndex f) {
    std::ifstream in(paths_[f], std::ios::binary);
    return std::string((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  }
  void Write(FileIndex f, const std::string& content) {
    std::ofstream(paths_[f], std::ios::binary | std::ios::trunc) << content;
  }

  kvasr_test::TempDir dir_;
  Paths paths_;
};

TEST_F(BrokenModelTest, MissingFilesAndUnknownLanguages) {
  for (const FileIndex f : {kModel, kVocab, kPunc, kNum, kCase, kXdb, kBpe}) {
    Paths p = paths_;
    p[f] = dir_.path() + "/absent.txt";
    EXPECT_NE(FailingInit(p).find("absent.txt"), std::string::npos) << kFileNames[f];
    if (f == kNum || f == kCase || f == kXdb) continue;
    p[f] = "";
    EXPECT_NE(FailingInit(p).find("needs"), std::string::npos) << kFileNames[f];
  }
  for (const char* lang : {"xx", "", "th", static_cast<const char*>(nullptr)}) {
    EXPECT_NE(FailingInit(paths_, lang).find("unsupported language"), std::string::npos) << lang;
  }
}

TEST_F(BrokenModelTest, DamagedFilesAreRefusedWithTheReason) {
  const std::string model = Read(kModel), vocab = Read(kVocab);
  std::string flipped = model;
  flipped[model.size() / 2] ^= 0x10;
  const struct {
    FileIndex file;
    std::string content;
    const char* reason;
  } cases[] = {
      {kModel, flipped, "corrupt"},
      {kModel, model.substr(0, model.size() - 100), "corrupt"},
      {kModel, "", "not a punctuation model"},
      {kModel, vocab, "not a punctuation model"},
      {kVocab, vocab.substr(0, vocab.rfind('\n', vocab.size() - 2) + 1), "entries"},
      {kVocab, vocab.substr(vocab.find('\n') + 1), "is not a vocab file"},
      {kVocab, "#kvasr-punct-vocab 2" + vocab.substr(vocab.find('\n')), "version"},
      {kBpe, Read(kBpe) + "zz qq\n", "unknown piece"},
      {kPunc, "#kvasr-punct-labels 1\nO\t\tnone\nPERIOD\t.\tend\n", "entries"},
      {kPunc, "#kvasr-punct-labels 1\nO\t\tnone\nCOMMA\t,\tsometimes\n", "bad line"},
      {kCase, "#kvasr-punct-case 1\nnasa\n", "bad line"},
      {kNum, "#kvasr-punct-num 1\nunit one\n", "bad line"},
      {kXdb, "#kvasr-punct-xdb 1\nreplace\tone\n", "bad line"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(kFileNames[c.file]) + ": " + c.reason);
    const std::string good = Read(c.file);
    Write(c.file, c.content);
    const std::string err = FailingInit(paths_);
    EXPECT_NE(err.find(c.reason), std::string::npos) << err;
    Write(c.file, good);
  }
}

}  // namespace
