// Collects the microphone's first channel in blocks of BLOCK_FRAMES and posts
// each block (a transferred Float32Array, full scale +-1) to the page, which
// feeds the decoder. Render quanta are 128 frames; a larger block keeps the
// messages few.
const BLOCK_FRAMES = 2048;

class CaptureProcessor extends AudioWorkletProcessor {
  constructor() {
    super();
    this.block = new Float32Array(BLOCK_FRAMES);
    this.filled = 0;
  }

  process(inputs) {
    const channel = inputs[0] && inputs[0][0];
    if (!channel) return true;  // no input connected yet
    let offset = 0;
    while (offset < channel.length) {
      const n = Math.min(channel.length - offset, BLOCK_FRAMES - this.filled);
      this.block.set(channel.subarray(offset, offset + n), this.filled);
      this.filled += n;
      offset += n;
      if (this.filled === BLOCK_FRAMES) {
        this.port.postMessage(this.block, [this.block.buffer]);
        this.block = new Float32Array(BLOCK_FRAMES);
        this.filled = 0;
      }
    }
    return true;
  }
}

registerProcessor('sorvel-capture', CaptureProcessor);
