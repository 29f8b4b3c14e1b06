// SPDX-License-Identifier: Apache-2.0
// The C entry points: argument checks and the C++/C boundary. Behaviour is
// documented in platform/decoder/README.md.
#include <exception>

#include "kvasr_decoder_api.h"
#include "kvasr_decoder_constants.h"
#include "manifest.h"
#include "recognizer.h"

#define KVASR_DECODER_EXPORT extern "C" __attribute__((visibility("default")))

using kvasr::decoder::ReadManifest;
using kvasr::decoder::Recognizer;
using kvasr::decoder::ReportError;

namespace {

Recognizer* AsRecognizer(void* decoder) { return static_cast<Recognizer*>(decoder); }

// No C++ exception may reach a C caller; allocation failures and exceptions
// thrown by a caller's callback end here.
template <typename Body>
int Guarded(const char* function, Body body) {
  try {
    return body();
  } catch (const std::exception& e) {
    ReportError(std::string(function) + ": " + e.what());
  } catch (...) {
    ReportError(std::string(function) + ": unknown exception");
  }
  return KVASR_DECODER_ERR_RECOGNISER;
}

// Runs a call that may deliver callbacks, then completes a destruction asked
// for from inside one of them.
template <typename Body>
int Delivering(const char* function, void* decoder, Body body) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  Recognizer* recognizer = AsRecognizer(decoder);
  const int result = Guarded(function, [&] { return body(recognizer); });
  if (recognizer->destroy_requested() && !recognizer->InCallback()) delete recognizer;
  return result;
}

}  // namespace

KVASR_DECODER_EXPORT void* mwDecoderInit(FILE* model_file, int reserved, int lang_flag) {
  // The manifest names the model and with it the language, so the flag
  // changes nothing here.
  (void)lang_flag;
  if (reserved != 0) {
    ReportError("mwDecoderInit: the reserved argument must be 0");
    return nullptr;
  }
  Recognizer* recognizer = nullptr;
  Guarded("mwDecoderInit", [&] {
    const auto settings = ReadManifest(model_file);
    if (settings) recognizer = Recognizer::Create(*settings).release();
    return 0;
  });
  return recognizer;
}

KVASR_DECODER_EXPORT void mwDecoderDestroy(void* decoder) {
  if (decoder == nullptr) return;
  Recognizer* recognizer = AsRecognizer(decoder);
  if (recognizer->InCallback()) {
    recognizer->RequestDestroy();
  } else {
    delete recognizer;
  }
}

KVASR_DECODER_EXPORT int mwSetVadEnabled(void* decoder, int enabled) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  AsRecognizer(decoder)->SetSpeechEndDetection(enabled != 0);
  return 0;
}

KVASR_DECODER_EXPORT int mwSetAutoStopEnabled(void* decoder, int enabled) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  AsRecognizer(decoder)->SetAutoStop(enabled != 0);
  return 0;
}

// `first`: leading silence in milliseconds after which an utterance without
// speech ends (0: never). `second`: trailing silence in milliseconds that
// ends speech.
KVASR_DECODER_EXPORT int mwSetVadThreshold(void* decoder, int32_t first, int32_t second) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  return AsRecognizer(decoder)->SetSpeechEndLimits(first, second);
}

KVASR_DECODER_EXPORT int mwSetOutHandle(void* decoder, void* out_handle) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  AsRecognizer(decoder)->SetOutHandle(out_handle);
  return 0;
}

KVASR_DECODER_EXPORT int mwSetOnSpeechEnd(void* decoder, mw_speech_end_callback callback) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  AsRecognizer(decoder)->SetOnSpeechEnd(callback);
  return 0;
}

KVASR_DECODER_EXPORT int mwSetOnResult(void* decoder, mw_result_callback callback) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  AsRecognizer(decoder)->SetOnResult(callback);
  return 0;
}

KVASR_DECODER_EXPORT int mwStartDecode(void* decoder) {
  if (decoder == nullptr) return KVASR_DECODER_ERR_ARGUMENT;
  return Guarded("mwStartDecode", [&] { return AsRecognizer(decoder)->Start(); });
}

KVASR_DECODER_EXPORT int mwSetData(void* decoder, const int16_t* samples, int64_t count, int last) {
  return Delivering("mwSetData", decoder, [&](Recognizer* recognizer) {
    return recognizer->Feed(samples, count, last != 0);
  });
}

KVASR_DECODER_EXPORT int mwStopDecode(void* decoder) {
  return Delivering("mwStopDecode", decoder,
                    [](Recognizer* recognizer) { return recognizer->Stop(); });
}

KVASR_DECODER_EXPORT const char* mwGetVersion(void) {
  return "kvasr_decoder " KVASR_DECODER_VERSION " (PocketSphinx " KVASR_POCKETSPHINX_VERSION ")";
}
