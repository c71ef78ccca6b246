// Computes the reference features of the nanodet test: the original graph
// model run with TensorFlow.js (pure JavaScript CPU backend) on the network
// inputs the library prepares, written by the C++ test as 256 x 256 PPM
// canvases. Prints JSON: for each canvas the mean over height and width of
// the feature tensor, 512 values.
//
//   node nanodet-features.mjs NETWORK_DIR CANVAS.ppm...
//
// Run by scripts/reference/make-nanodet-reference.sh.
import fs from 'node:fs';
import path from 'node:path';
import { createRequire } from 'node:module';

const require = createRequire(process.env.TFJS_PREFIX + '/');
const tf = require('@tensorflow/tfjs');

const featureTensor = 'PartitionedCall/onnx_tf_prefix_Concat_62';
const crop = 225;
const canvas = 256;
// The detector's normalisation, channels B, G, R.
const mean = [103.53, 116.28, 123.675];
const std = [57.375, 57.12, 58.395];

function readPpm(file) {
  const bytes = fs.readFileSync(file);
  // Header: P6 <width> <height> <maxval>, whitespace separated, one byte after.
  const fields = [];
  let i = 0;
  while (fields.length < 4) {
    while (/\s/.test(String.fromCharCode(bytes[i]))) i++;
    let start = i;
    while (!/\s/.test(String.fromCharCode(bytes[i]))) i++;
    fields.push(bytes.subarray(start, i).toString());
  }
  i++;
  const [magic, width, height, maxval] = [fields[0], +fields[1], +fields[2], +fields[3]];
  if (magic !== 'P6' || maxval !== 255 || width !== canvas || height !== canvas) throw new Error(`${file}: not a ${canvas} x ${canvas} 8-bit P6 canvas`);
  return { width, height, rgb: bytes.subarray(i, i + width * height * 3) };
}

async function main() {
  const [networkDir, ...canvases] = process.argv.slice(2);
  await tf.setBackend('cpu');
  const model = JSON.parse(fs.readFileSync(path.join(networkDir, 'nanodet.json'), 'utf8'));
  // The graph declares 416 x 416; the layers themselves take any size.
  for (const node of model.modelTopology.node)
    if (node.op === 'Placeholder') for (const d of node.attr.shape.shape.dim.slice(2)) d.size = '-1';
  const group = model.weightsManifest[0];
  const shards = group.paths.map((p) => fs.readFileSync(path.join(networkDir, p)));
  const weightData = Buffer.concat(shards);
  const graph = await tf.loadGraphModel(tf.io.fromMemory({
    modelTopology: model.modelTopology,
    weightSpecs: group.weights,
    weightData: weightData.buffer.slice(weightData.byteOffset, weightData.byteOffset + weightData.byteLength),
  }));
  const offset = Math.floor((canvas - crop) / 2);  // the data layer's centre crop
  const out = {};
  for (const file of canvases) {
    const { rgb } = readPpm(file);
    const input = new Float32Array(3 * crop * crop);
    for (let c = 0; c < 3; c++) {          // c: B, G, R
      const source = 2 - c;                 // PPM holds R, G, B
      for (let y = 0; y < crop; y++)
        for (let x = 0; x < crop; x++) {
          const v = rgb[((y + offset) * canvas + (x + offset)) * 3 + source];
          input[(c * crop + y) * crop + x] = v;
        }
    }
    const features = tf.tidy(() => {
      const pixels = tf.tensor4d(input, [1, 3, crop, crop]);
      const normalised = pixels.sub(tf.tensor(mean, [1, 3, 1, 1])).div(tf.tensor(std, [1, 3, 1, 1]));
      const map = graph.execute({ input_1: normalised }, featureTensor);
      return map.mean([2, 3]).reshape([-1]);
    });
    out[path.basename(file, '.ppm')] = Array.from(features.dataSync());
    features.dispose();
  }
  process.stdout.write(JSON.stringify(out) + '\n');
}

main().catch((e) => { console.error(e); process.exit(1); });
