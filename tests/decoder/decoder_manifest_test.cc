// SPDX-License-Identifier: Apache-2.0
// Reading the model manifest through mwDecoderInit: every fault gives a null
// handle and one explaining line on standard error.
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>

#include "kvasr_decoder_api.h"
#include "temp_dir.h"

namespace {

namespace fs = std::filesystem;

const std::string kModelDir = "/usr/share/pocketsphinx/model/en-us";
const std::string kTag = "kvasr-decoder-manifest 1\n";
const std::string kAcousticModel = "acoustic_model = " + kModelDir + "/en-us\n";
const std::string kDictionary = "dictionary = " + kModelDir + "/cmudict-en-us.dict\n";
const std::string kLanguageModel = "language_model = " + kModelDir + "/en-us.lm.bin\n";
const std::string kValid = kTag + kAcousticModel + kDictionary + kLanguageModel;

struct InitOutcome {
  void* handle;
  std::string error_output;
};

InitOutcome InitFrom(FILE* file, int reserved = 0) {
  testing::internal::CaptureStderr();
  void* handle = mwDecoderInit(file, reserved, 0);
  return {handle, testing::internal::GetCapturedStderr()};
}

InitOutcome InitFromPath(const fs::path& path) {
  FILE* file = fopen(path.c_str(), "rb");
  EXPECT_NE(file, nullptr) << path;
  const InitOutcome outcome = InitFrom(file);
  if (file != nullptr) fclose(file);
  return outcome;
}

// A fresh folder for manifests, removed with what it holds.
class DecoderManifest : public testing::Test {
 protected:
  fs::path Write(const std::string& text) {
    const fs::path path = dir_ / "model.manifest";
    std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
    return path;
  }

  kvasr_test::TempDir tmp_;
  const fs::path dir_{tmp_.path()};
};

void ExpectLoadsQuietly(const InitOutcome& outcome) {
  EXPECT_NE(outcome.handle, nullptr);
  EXPECT_EQ(outcome.error_output, "");
  mwDecoderDestroy(outcome.handle);
}

void ExpectRejected(const InitOutcome& outcome, const std::string& fragment) {
  EXPECT_EQ(outcome.handle, nullptr);
  mwDecoderDestroy(outcome.handle);
  EXPECT_EQ(outcome.error_output.rfind("kvasr_decoder: ", 0), 0u) << outcome.error_output;
  EXPECT_NE(outcome.error_output.find(fragment), std::string::npos) << outcome.error_output;
  EXPECT_EQ(outcome.error_output.find('\n'), outcome.error_output.size() - 1)
      << outcome.error_output;
}

TEST_F(DecoderManifest, ValidManifestsLoadQuietly) {
  for (const std::string& text :
       {kValid, "kvasr-decoder-manifest 1\r\n# comment\r\n\r\n  " + kAcousticModel + kDictionary +
                    kLanguageModel + "log = off\r\noption.beam = 1e-40\r\n"}) {
    ExpectLoadsQuietly(InitFromPath(Write(text)));
  }
}

TEST_F(DecoderManifest, EachFaultIsRejectedWithItsReason) {
  const struct {
    std::string text;
    const char* fragment;
  } cases[] = {
      {"", "empty file"},
      {std::string("\x7f"
                   "ELF\0\0\x01",
                   7),
       "not a text file"},
      {"hello world\n", "first line must be"},
      {"kvasr-decoder-manifesto 1\n" + kAcousticModel, "first line must be"},
      {"kvasr-decoder-manifest 2\n" + kAcousticModel, "unsupported format version \"2\""},
      {kTag, "missing key \"acoustic_model\""},
      {kTag + kAcousticModel + kLanguageModel, "missing key \"dictionary\""},
      {kTag + kAcousticModel + kDictionary, "exactly one of"},
      {kValid + "grammar = " + kModelDir + "/en-us.lm.bin\n", "exactly one of"},
      {kValid + "acoustic_modle = x\n", "line 5: unknown key \"acoustic_modle\""},
      {kValid + kDictionary, "line 5: key \"dictionary\" given twice"},
      {kValid + "log stderr\n", "line 5: expected \"key = value\""},
      {kValid + "log =\n", "line 5: expected \"key = value\""},
      {kValid + "log = verbose\n", "log must be"},
      {kTag + kAcousticModel + "dictionary = /nonexistent/x.dict\n" + kLanguageModel,
       "\"/nonexistent/x.dict\" is not a readable file"},
      {kTag + "acoustic_model = " + kModelDir + "/en-us.lm.bin\n" + kDictionary + kLanguageModel,
       "is not a directory"},
      {kTag + "acoustic_model = /tmp\n" + kDictionary + kLanguageModel, "has no file \"mdef\""},
      {kValid + "option.beem = 1e-40\n", "unknown recogniser option \"beem\""},
      {kValid + "option.dict = /tmp/x\n", "option \"dict\" is set by"},
      {kValid + "option.samprate = 8000\n", "option \"samprate\" is set by"},
      {kTag + std::string(70 * 1024, '#'), "larger than"},
      // A readable file that is no language model.
      {kTag + kAcousticModel + kDictionary + "language_model = " + kModelDir +
           "/cmudict-en-us.dict\n",
       "could not load the model"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.fragment);
    ExpectRejected(InitFromPath(Write(c.text)), c.fragment);
  }
  ExpectRejected(InitFrom(nullptr), "no model manifest file");
  FILE* file = fopen(Write(kValid).c_str(), "rb");
  ASSERT_NE(file, nullptr);
  ExpectRejected(InitFrom(file, 1), "reserved argument must be 0");
  fclose(file);
}

TEST_F(DecoderManifest, RelativePathsAreTakenFromTheManifestsOwnFolder) {
  for (const char* name : {"en-us", "cmudict-en-us.dict", "en-us.lm.bin"}) {
    fs::create_symlink(kModelDir + "/" + name, dir_ / name);
  }
  const fs::path manifest = Write(kTag +
                                  "acoustic_model = en-us\ndictionary = cmudict-en-us.dict\n"
                                  "language_model = ./en-us.lm.bin\n");
  const fs::path previous_dir = fs::current_path();
  fs::current_path("/");
  const InitOutcome outcome = InitFromPath(manifest);
  fs::current_path(previous_dir);
  EXPECT_NE(outcome.handle, nullptr) << outcome.error_output;
  mwDecoderDestroy(outcome.handle);

  // Neither a pipe nor a deleted file has a folder to resolve against.
  FILE* pipe = popen(("cat " + manifest.string()).c_str(), "r");
  ASSERT_NE(pipe, nullptr);
  ExpectRejected(InitFrom(pipe), "relative path \"en-us\"");
  pclose(pipe);
  FILE* file = fopen(manifest.c_str(), "rb");
  ASSERT_NE(file, nullptr);
  fs::remove(manifest);
  ExpectRejected(InitFrom(file), "manifest's own location cannot be found");
  fclose(file);
}

// A base manifest in the test folder and a grammar beside it.
class DecoderManifestBase : public DecoderManifest {
 protected:
  fs::path WriteFile(const std::string& name, const std::string& text) {
    const fs::path path = dir_ / name;
    std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
    return path;
  }

  fs::path WriteGrammar(const std::string& body) {
    return WriteFile("commands.gram", "#JSGF V1.0;\ngrammar commands;\n" + body);
  }

  static std::string OnBase(const std::string& lines) {
    return kTag + "base = base.manifest\n" + lines;
  }

  void SetUp() override { WriteFile("base.manifest", kValid + "option.beam = 1e-40\n"); }
};

TEST_F(DecoderManifestBase, AManifestTakesWhatItDoesNotNameFromItsBase) {
  WriteGrammar("public <c> = go (forward | back) [ten meters] | stop;\n");
  for (const std::string& text :
       {OnBase(""), OnBase("grammar = commands.gram\n"), OnBase("option.beam = 1e-48\n"),
        // The base's own relative paths are its folder's, not the child's.
        kTag + "base = " + (dir_ / "base.manifest").string() + "\n" + kLanguageModel}) {
    SCOPED_TRACE(text);
    ExpectLoadsQuietly(InitFromPath(Write(text)));
  }
}

TEST_F(DecoderManifestBase, FaultsOfBasesAndGrammarsSayWhere) {
  const struct {
    std::string grammar;
    std::string manifest;
    std::string fragment;
  } cases[] = {
      {"", kTag + "base = missing.manifest\n",
       "line 2: base \"" + dir_.string() + "/missing.manifest\" is not a readable file"},
      {"", kTag + "base = model.manifest\n", "nested more than 8 deep"},
      {"", OnBase("grammar = commands.gram\nlanguage_model = x\n"), "exactly one of"},
      {"", OnBase("dictionary = /nonexistent.dict\n"), "\"/nonexistent.dict\" is not a readable"},
      {"public <c> = go forward;\n", kTag + "base = commands.gram\n",
       "commands.gram line 1: first line must be"},
      // Quoted, commented and tagged text around the word, which is the
      // second one missing; its first mention is a comment.
      {"// florp\n<x> = \"go\" {tag} /2/ forward;\npublic <c> = <x>\n  | stop florp;\n",
       OnBase("grammar = commands.gram\n"),
       "grammar \"" + dir_.string() +
           "/commands.gram\" line 6: word \"florp\" is not in the dictionary"},
      {"<c> = go forward;\n", OnBase("grammar = commands.gram\n"), "has no public rule"},
      {"public <c> = go (forward;\n", OnBase("grammar = commands.gram\n"), "is not valid JSGF"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.fragment);
    WriteGrammar(c.grammar);
    ExpectRejected(InitFromPath(Write(c.manifest)), c.fragment);
  }
}

TEST(DecoderVersion, NamesThisLibraryAndTheRecogniser) {
  const std::string version = mwGetVersion();
  EXPECT_EQ(version.rfind("kvasr_decoder ", 0), 0u) << version;
  EXPECT_NE(version.find("PocketSphinx"), std::string::npos) << version;
}

}  // namespace
