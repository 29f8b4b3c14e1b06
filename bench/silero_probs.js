// SPDX-License-Identifier: Apache-2.0
// Per-frame speech probabilities of the Silero VAD (v5 ONNX model of the npm
// package @ricky0123/vad-web, run with onnxruntime-node), written as
// <name>.prob (float32 per 10 ms frame) for training/vad/evaluate.py.
//
//   NODE_PATH=<dir>/node_modules node bench/silero_probs.js MODEL.onnx OUT_DIR FILE.wav...
//
// The model takes 512-sample windows at 16 kHz with the previous window's
// last 64 samples in front and carries a recurrent state. Frame f (samples
// 160 f .. 160 f + 399, as the kvasr detector frames them) takes the
// probability of the window holding its centre sample.
const fs = require('fs');
const path = require('path');
const ort = require('onnxruntime-node');

const RATE_HZ = 16000;
const WINDOW_SAMPLES = 512;
const CONTEXT_SAMPLES = 64;
const FRAME_SHIFT_SAMPLES = 160;
const FRAME_SAMPLES = 400;
const STATE_SIZE = 2 * 128;

function readWav16(file) {
  const b = fs.readFileSync(file);
  if (b.toString('ascii', 0, 4) !== 'RIFF' || b.toString('ascii', 8, 12) !== 'WAVE') {
    throw new Error(`${file}: not a WAV file`);
  }
  let pos = 12;
  let format = null;
  while (pos + 8 <= b.length) {
    const id = b.toString('ascii', pos, pos + 4);
    const size = b.readUInt32LE(pos + 4);
    if (id === 'fmt ') {
      format = {channels: b.readUInt16LE(pos + 10), rate: b.readUInt32LE(pos + 12),
                bits: b.readUInt16LE(pos + 22)};
    } else if (id === 'data') {
      if (!format || format.channels !== 1 || format.rate !== RATE_HZ || format.bits !== 16) {
        throw new Error(`${file}: needs 16 kHz 16-bit mono`);
      }
      const n = Math.floor(size / 2);
      const x = new Float32Array(n);
      for (let i = 0; i < n; ++i) x[i] = b.readInt16LE(pos + 8 + 2 * i) / 32768;
      return x;
    }
    pos += 8 + size + (size & 1);
  }
  throw new Error(`${file}: no data chunk`);
}

async function windowProbs(session, x) {
  const sr = new ort.Tensor('int64', [BigInt(RATE_HZ)]);
  let state = new ort.Tensor('float32', new Float32Array(STATE_SIZE), [2, 1, 128]);
  let context = new Float32Array(CONTEXT_SAMPLES);
  const windows = Math.floor(x.length / WINDOW_SAMPLES);
  const probs = new Float32Array(windows);
  for (let w = 0; w < windows; ++w) {
    const frame = x.subarray(w * WINDOW_SAMPLES, (w + 1) * WINDOW_SAMPLES);
    const input = new Float32Array(CONTEXT_SAMPLES + WINDOW_SAMPLES);
    input.set(context, 0);
    input.set(frame, CONTEXT_SAMPLES);
    context = frame.slice(-CONTEXT_SAMPLES);
    const out = await session.run({
      input: new ort.Tensor('float32', input, [1, input.length]), state, sr});
    state = out.stateN;
    probs[w] = out.output.data[0];
  }
  return probs;
}

async function main() {
  const [model, outDir, ...files] = process.argv.slice(2);
  if (!model || !outDir || files.length === 0) {
    console.error('usage: silero_probs.js MODEL.onnx OUT_DIR FILE.wav...');
    process.exit(2);
  }
  const session = await ort.InferenceSession.create(model, {intraOpNumThreads: 1});
  let seconds = 0;
  const started = process.hrtime.bigint();
  for (const file of files) {
    const x = readWav16(file);
    const probs = await windowProbs(session, x);
    const frames = Math.max(0, Math.floor((x.length - FRAME_SAMPLES) / FRAME_SHIFT_SAMPLES) + 1);
    const perFrame = new Float32Array(frames);
    for (let f = 0; f < frames; ++f) {
      const w = Math.floor((f * FRAME_SHIFT_SAMPLES + FRAME_SAMPLES / 2) / WINDOW_SAMPLES);
      perFrame[f] = probs.length ? probs[Math.min(w, probs.length - 1)] : 0;
    }
    const name = path.basename(file).replace(/\.[^.]*$/, '');
    fs.writeFileSync(path.join(outDir, name + '.prob'), Buffer.from(perFrame.buffer));
    seconds += x.length / RATE_HZ;
  }
  const elapsed = Number(process.hrtime.bigint() - started) / 1e9;
  console.error(`${files.length} files, ${seconds.toFixed(1)} s of audio in ${elapsed.toFixed(1)} s`);
}

main().catch((e) => { console.error(e); process.exit(1); });
