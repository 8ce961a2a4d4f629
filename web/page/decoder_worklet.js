// Decodes the microphone on the audio rendering thread: the processor feeds
// every render quantum of its input's first channel to a WebAssembly decoder
// and posts the tokens it hears to the page. The page compiles the module
// once and passes it in processorOptions.wasmModule; here it is only
// instantiated.
//
// Messages from the page:  {type: 'configure', settings}
//                          {type: 'close'}  (frees the decoder; the node ends)
// Messages to the page:    {type: 'ready'}, {type: 'failed', message}  (once)
//                          {type: 'configured', error}  (one per configure;
//                              "" or the problem, the old decoder kept)
//                          {type: 'tokens', tokens}     (hex strings)
//                          {type: 'error', message}     (a message it cannot use)
import {instantiateModem} from './modem.js';

class DecoderProcessor extends AudioWorkletProcessor {
  constructor(options) {
    super();
    this.decoder = null;
    this.closed = false;
    this.pending = [];  // messages that arrived before the module was ready
    // The decoder takes samples on the 16-bit scale; one render quantum.
    this.scaled = new Float32Array(128);
    this.port.onmessage = (event) => {
      const closing = event.data && event.data.type === 'close';
      if (this.decoder || this.closed || closing) this.handle(event.data);
      else this.pending.push(event.data);
    };
    const wasmModule = options && options.processorOptions && options.processorOptions.wasmModule;
    if (!(wasmModule instanceof WebAssembly.Module)) {
      this.closed = true;
      this.port.postMessage({type: 'failed', message: 'processorOptions.wasmModule must be a WebAssembly.Module'});
      return;
    }
    instantiateModem(wasmModule).then((modem) => {
      if (this.closed) return;
      this.decoder = new modem.Decoder();
      this.port.postMessage({type: 'ready'});
      for (const message of this.pending) this.handle(message);
      this.pending = [];
    }, (error) => {
      this.closed = true;
      this.port.postMessage({type: 'failed', message: String(error && error.message || error)});
    });
  }

  handle(message) {
    if (message && message.type === 'close') {
      if (this.decoder) this.decoder.delete();
      this.decoder = null;
      this.closed = true;
    } else if (this.closed) {
      this.port.postMessage({type: 'error', message: 'the decoder is closed'});
    } else if (message && message.type === 'configure') {
      this.port.postMessage({type: 'configured', error: this.decoder.configure(message.settings)});
    } else {
      this.port.postMessage({type: 'error',
                             message: 'the decoder takes {type: "configure", settings} and {type: "close"}'});
    }
  }

  process(inputs) {
    if (this.closed) return false;
    const channel = inputs[0] && inputs[0][0];
    // Nothing connected yet, or still loading: the audio is not kept.
    if (!channel || !this.decoder) return true;
    if (this.scaled.length !== channel.length) this.scaled = new Float32Array(channel.length);
    for (let i = 0; i < channel.length; ++i) this.scaled[i] = channel[i] * 32768;
    const tokens = this.decoder.process(this.scaled);
    if (tokens.length) this.port.postMessage({type: 'tokens', tokens});
    return true;
  }
}

registerProcessor('sorvel-decoder', DecoderProcessor);
