// The library through its three C functions, with the shipped English model.
#include <gtest/gtest.h>

#include <unistd.h>

#include <cctype>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "kvasr_punctuator_api.h"

namespace {

const std::string kModelDir = KVASR_PUNCT_MODEL_DIR;
const char* const kFileNames[] = {"model.bin", "vocab.txt", "punc.txt", "num.txt", "case.txt", "xdb.txt", "bpe.txt"};
constexpr int kFiles = 7;
enum FileIndex { kModel, kVocab, kPunc, kNum, kCase, kXdb, kBpe };

struct Paths {
  std::string p[kFiles];
};

Paths PathsIn(const std::string& dir) {
  Paths paths;
  for (int i = 0; i < kFiles; ++i) paths.p[i] = dir + "/" + kFileNames[i];
  return paths;
}

void* Init(const Paths& paths, const char* lang = "en") {
  return punctuator_init(paths.p[kModel].c_str(), paths.p[kVocab].c_str(), paths.p[kPunc].c_str(),
                         paths.p[kNum].c_str(), paths.p[kCase].c_str(), paths.p[kXdb].c_str(),
                         paths.p[kBpe].c_str(), lang);
}

// Init that must fail; returns what it wrote on standard error.
std::string FailingInit(const Paths& paths, const char* lang = "en") {
  testing::internal::CaptureStderr();
  void* h = Init(paths, lang);
  const std::string err = testing::internal::GetCapturedStderr();
  EXPECT_EQ(h, nullptr);
  punctuator_relese(h);
  EXPECT_FALSE(err.empty());
  EXPECT_EQ(err.back(), '\n');
  return err;
}

std::string Punctuate(void* h, const std::string& text) {
  int32_t size = 0;
  int r = punctuator_do_it(h, text.c_str(), nullptr, &size);
  if (r == 0) return std::string();
  EXPECT_EQ(r, 1);
  std::string out(static_cast<size_t>(size), '\0');
  r = punctuator_do_it(h, text.c_str(), &out[0], &size);
  EXPECT_EQ(r, 0);
  EXPECT_EQ(static_cast<size_t>(size), out.size());
  return out;
}

std::vector<std::string> Words(const std::string& s) {
  std::istringstream in(s);
  std::vector<std::string> w;
  std::string x;
  while (in >> x) w.push_back(x);
  return w;
}

// A word of the output without its mark, in lower case.
std::string Bare(std::string w) {
  while (!w.empty() && (w.back() == ',' || w.back() == '.' || w.back() == '?')) w.pop_back();
  for (char& c : w) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return w;
}

class ModelTest : public testing::Test {
 protected:
  void SetUp() override {
    handle_ = Init(PathsIn(kModelDir));
    ASSERT_NE(handle_, nullptr);
  }
  void TearDown() override { punctuator_relese(handle_); }
  void* handle_ = nullptr;
};

TEST_F(ModelTest, TooSmallBufferAsksForTheExactSizeAndChangesNothing) {
  const std::string text = "so what do you think about that i think it is great";
  const std::string full = Punctuate(handle_, text);
  ASSERT_FALSE(full.empty());
  const int32_t n = static_cast<int32_t>(full.size());

  for (const int32_t small : {0, 1, n - 1}) {
    std::string buf(static_cast<size_t>(n) + 8, '#');
    int32_t size = small;
    EXPECT_EQ(punctuator_do_it(handle_, text.c_str(), &buf[0], &size), 1) << small;
    EXPECT_EQ(size, n);
    EXPECT_EQ(buf, std::string(static_cast<size_t>(n) + 8, '#'));
  }
  std::string buf(static_cast<size_t>(n) + 8, '#');
  for (const int32_t enough : {n, n + 8}) {
    int32_t size = enough;
    ASSERT_EQ(punctuator_do_it(handle_, text.c_str(), &buf[0], &size), 0);
    EXPECT_EQ(size, n);
    EXPECT_EQ(buf.substr(0, static_cast<size_t>(n)), full);
    EXPECT_EQ(buf.substr(static_cast<size_t>(n)), std::string(8, '#'));
  }
}

TEST_F(ModelTest, ANewTextAfterARetryIsNotTheOldAnswer) {
  const std::string a = Punctuate(handle_, "hello there how are you");
  int32_t size = 1;
  char c;
  EXPECT_EQ(punctuator_do_it(handle_, "the first text was longer than this one", &c, &size), 1);
  const std::string b = Punctuate(handle_, "good morning");
  EXPECT_EQ(Words(b).size(), 2u);
  EXPECT_EQ(Bare(Words(b)[0]), "good");
  EXPECT_NE(a, b);
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

TEST_F(ModelTest, PunctuatesAndCasesRecognisedText) {
  const std::string out =
      Punctuate(handle_, "what do you think happened next i asked my friend john in new york and he said nothing");
  // The features the model must get right on any sensible training.
  EXPECT_NE(out.find('?'), std::string::npos) << out;
  EXPECT_EQ(out.rfind("What ", 0), 0u) << out;
  EXPECT_NE(out.find(" I "), std::string::npos) << out;
  EXPECT_NE(out.find("New York"), std::string::npos) << out;
}

TEST_F(ModelTest, SpelledNumbersBecomeDigits) {
  const std::string out = Punctuate(handle_, "she was born in nineteen ninety five and has twenty three cats");
  EXPECT_NE(out.find(" 1995"), std::string::npos) << out;
  EXPECT_NE(out.find(" 23 cats"), std::string::npos) << out;
  EXPECT_EQ(Words(out).size(), 9u) << out;
}

TEST_F(ModelTest, EmptyAndBlankTextGiveEmptyOutput) {
  for (const char* text : {"", "   ", "\t\n", " . , ? "}) {
    int32_t size = 16;
    char buf[16];
    EXPECT_EQ(punctuator_do_it(handle_, text, buf, &size), 0) << '"' << text << '"';
    EXPECT_EQ(size, 0);
  }
}

TEST_F(ModelTest, VeryLongTextKeepsEveryWord) {
  const std::vector<std::string> pool = Words(
      "we looked at the data and found that most people in the study were happy with their work "
      "but some of them said they wanted more time with family so we asked why");
  std::string text;
  constexpr size_t kWords = 6000;
  for (size_t i = 0; i < kWords; ++i) text += pool[(i * 7 + i / 13) % pool.size()] + " ";
  const std::string out = Punctuate(handle_, text);
  const std::vector<std::string> words = Words(out);
  ASSERT_EQ(words.size(), kWords);
  size_t marks = 0;
  for (size_t i = 0; i < kWords; ++i) {
    ASSERT_EQ(Bare(words[i]), pool[(i * 7 + i / 13) % pool.size()]) << "word " << i;
    marks += Bare(words[i]).size() != words[i].size();
  }
  // Punctuated throughout, not only in the first window.
  EXPECT_GT(marks, kWords / 50);
  size_t late_marks = 0;
  for (size_t i = kWords - 500; i < kWords; ++i) late_marks += Bare(words[i]).size() != words[i].size();
  EXPECT_GT(late_marks, 5u);
}

TEST_F(ModelTest, BadArgumentsFail) {
  int32_t size = 10;
  char buf[10];
  for (int r : {punctuator_do_it(nullptr, "hello", buf, &size), punctuator_do_it(handle_, nullptr, buf, &size),
                punctuator_do_it(handle_, "hello", buf, nullptr), punctuator_do_it(handle_, "hello", nullptr, &size)}) {
    EXPECT_NE(r, 0);
    EXPECT_NE(r, 1);
  }
  size = -1;
  const int r = punctuator_do_it(handle_, "hello", buf, &size);
  EXPECT_NE(r, 0);
  EXPECT_NE(r, 1);
  punctuator_relese(nullptr);
}

TEST(ModelWithoutOptionalFiles, WorksAndLeavesNumbersInWords) {
  Paths paths = PathsIn(kModelDir);
  paths.p[kNum] = paths.p[kCase] = paths.p[kXdb] = "";
  void* h = Init(paths);
  ASSERT_NE(h, nullptr);
  const std::vector<std::string> out = Words(Punctuate(h, "there were twenty three of them"));
  ASSERT_EQ(out.size(), 6u);
  EXPECT_EQ(Bare(out[2]), "twenty");
  EXPECT_EQ(Bare(out[3]), "three");
  punctuator_relese(h);
}

// A copy of the shipped model in a temporary folder, to break.
class BrokenModelTest : public testing::Test {
 protected:
  void SetUp() override {
    char tmpl[] = "/tmp/kvasr-punct-XXXXXX";
    ASSERT_NE(mkdtemp(tmpl), nullptr);
    dir_ = tmpl;
    for (const char* name : kFileNames) {
      std::ifstream in(kModelDir + "/" + name, std::ios::binary);
      std::ofstream out(dir_ + "/" + name, std::ios::binary);
      out << in.rdbuf();
    }
    paths_ = PathsIn(dir_);
    // Otherwise every refusal below would pass for the wrong reason.
    void* h = Init(paths_);
    ASSERT_NE(h, nullptr);
    punctuator_relese(h);
  }
  void TearDown() override {
    for (const char* name : kFileNames) std::remove((dir_ + "/" + name).c_str());
    rmdir(dir_.c_str());
  }
  std::string Read(FileIndex f) {
    std::ifstream in(paths_.p[f], std::ios::binary);
    return std::string((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  }
  void Write(FileIndex f, const std::string& content) {
    std::ofstream(paths_.p[f], std::ios::binary | std::ios::trunc) << content;
  }

  std::string dir_;
  Paths paths_;
};

TEST_F(BrokenModelTest, MissingFiles) {
  for (const FileIndex f : {kModel, kVocab, kPunc, kNum, kCase, kXdb, kBpe}) {
    Paths p = paths_;
    p.p[f] = dir_ + "/absent.txt";
    EXPECT_NE(FailingInit(p).find("absent.txt"), std::string::npos) << kFileNames[f];
  }
  for (const FileIndex f : {kModel, kVocab, kPunc, kBpe}) {
    Paths p = paths_;
    p.p[f] = "";
    EXPECT_NE(FailingInit(p).find("needs"), std::string::npos) << kFileNames[f];
  }
}

TEST_F(BrokenModelTest, CorruptModel) {
  const std::string good = Read(kModel);
  std::string flipped = good;
  flipped[good.size() / 2] ^= 0x10;
  Write(kModel, flipped);
  EXPECT_NE(FailingInit(paths_).find("corrupt"), std::string::npos);
  Write(kModel, good.substr(0, good.size() - 100));
  FailingInit(paths_);
  Write(kModel, "");
  FailingInit(paths_);
  Write(kModel, Read(kVocab));
  EXPECT_NE(FailingInit(paths_).find("not a punctuation model"), std::string::npos);
}

TEST_F(BrokenModelTest, FilesThatDoNotMatchTheModel) {
  const std::string vocab = Read(kVocab);
  Write(kVocab, vocab.substr(0, vocab.rfind('\n', vocab.size() - 2) + 1));
  EXPECT_NE(FailingInit(paths_).find("entries"), std::string::npos);
  Write(kVocab, vocab);
  const std::string bpe = Read(kBpe);
  Write(kBpe, bpe + "zz qq\n");
  FailingInit(paths_);
  Write(kBpe, bpe);
  Write(kPunc, "#kvasr-punct-labels 1\nO\t\tnone\nPERIOD\t.\tend\n");
  FailingInit(paths_);
  Write(kPunc, "#kvasr-punct-labels 1\nO\t\tnone\nCOMMA\t,\tsometimes\n");
  FailingInit(paths_);
}

TEST_F(BrokenModelTest, TextFilesNeedTheirHeaderAndVersion) {
  const std::string vocab = Read(kVocab);
  Write(kVocab, vocab.substr(vocab.find('\n') + 1));
  EXPECT_NE(FailingInit(paths_).find("is not a vocab file"), std::string::npos);
  Write(kVocab, "#kvasr-punct-vocab 2" + vocab.substr(vocab.find('\n')));
  EXPECT_NE(FailingInit(paths_).find("version"), std::string::npos);
  Write(kVocab, vocab);
  Write(kCase, "#kvasr-punct-case 1\nnasa\n");
  FailingInit(paths_);
  Write(kNum, "#kvasr-punct-num 1\nunit one\n");
  FailingInit(paths_);
  Write(kNum, "#kvasr-punct-num 1\nunit one 1\n");
  Write(kXdb, "#kvasr-punct-xdb 1\nreplace\tone\n");
  FailingInit(paths_);
}

TEST_F(BrokenModelTest, UnknownLanguage) {
  EXPECT_NE(FailingInit(paths_, "xx").find("unsupported language 'xx'"), std::string::npos);
  FailingInit(paths_, "");
  FailingInit(paths_, "th");
  testing::internal::CaptureStderr();
  EXPECT_EQ(punctuator_init(paths_.p[0].c_str(), paths_.p[1].c_str(), paths_.p[2].c_str(), paths_.p[3].c_str(),
                            paths_.p[4].c_str(), paths_.p[5].c_str(), paths_.p[6].c_str(), nullptr),
            nullptr);
  EXPECT_FALSE(testing::internal::GetCapturedStderr().empty());
}

}  // namespace
