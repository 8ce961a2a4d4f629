// The page: encodes a token and plays it through WebAudio, and listens
// through the microphone with the WebAssembly decoder running in an
// AudioWorklet (decoder_worklet.js), at the AudioContext's own rate, off the
// main thread. The module is compiled once here; the page's instance encodes.
import {compileModem, instantiateModem} from './modem.js';

const $ = (id) => document.getElementById(id);

// Band whose level the meter shows, Hz: where the DSSS carrier sits.
const BAND_LOW_HZ = 16000;
const BAND_HIGH_HZ = 20000;
const METER_FLOOR_DB = -120;

let wasmModule = null;  // the compiled WebAssembly.Module, shared with the worklet
let modem = null;     // the page's instance of it
let context = null;   // one AudioContext for playing and listening
let player = null;    // the AudioBufferSourceNode playing, if any
// {stream, source, worklet, analyser, settings (those of the decoder that
// listens), requested (settings sent, awaiting their answer)}
let listening = null;

// The sender's settings; the receiver adds the wake-up gate.
function settings() {
  return {
    scheme: $('scheme').value,
    crc: $('crc').checked,
    sampleRateHz: context ? context.sampleRate : 48000,
  };
}

function receiverSettings() {
  return {...settings(), hotsound: $('hotsound').checked};
}

function showError(id, message) {
  const box = $(id);
  box.textContent = message;
  box.hidden = !message;
}

function updateHint() {
  const bytes = modem.messageBytes(settings());
  const s = settings();
  $('token-hint').textContent =
      `${s.scheme}${s.crc ? ' with CRC' : ''}: tokens carry ${bytes} message bytes ` +
      `(${2 * bytes} hex digits).`;
}

async function audioContext() {
  if (!context) {
    context = new AudioContext();
    await context.audioWorklet.addModule('decoder_worklet.js');
  }
  if (context.state === 'suspended') await context.resume();
  return context;
}

async function play() {
  showError('send-error', '');
  $('send-info').textContent = '';
  let ctx;
  try {
    ctx = await audioContext();
  } catch (e) {
    showError('send-error', `No audio output: ${e.message}`);
    return;
  }
  const loop = Number($('loop').value);
  if ($('loop').value.trim() === '' || !Number.isFinite(loop)) {
    showError('send-error', 'loop must be a number of seconds');
    return;
  }
  const result = modem.encode(settings(), $('token').value, loop);
  if (result.error) {
    showError('send-error', result.error);
    return;
  }
  stopPlaying();
  const buffer = ctx.createBuffer(1, result.samples.length, result.sampleRateHz);
  buffer.copyToChannel(result.samples, 0);
  player = ctx.createBufferSource();
  player.buffer = buffer;
  player.connect(ctx.destination);
  player.onended = () => {
    player = null;
    $('stop-play').disabled = true;
  };
  player.start();
  $('stop-play').disabled = false;
  $('send-info').textContent =
      `Playing ${(result.samples.length / result.sampleRateHz).toFixed(2)} s at ` +
      `${result.sampleRateHz} Hz.`;
}

function stopPlaying() {
  if (player) player.stop();
  player = null;
  $('stop-play').disabled = true;
}

// Asks the worklet to build or rebuild the decoder for the current settings;
// its answer comes in onDecoderMessage.
function configureDecoder() {
  if (!listening) return;
  const s = receiverSettings();
  listening.requested.push(s);
  listening.worklet.port.postMessage({type: 'configure', settings: s});
}

// The worklet's answers arrive in the order of the requests. A refused
// change keeps the decoder that was listening.
function onDecoderMessage(event) {
  if (!listening) return;
  const message = event.data;
  switch (message.type) {
    case 'configured': {
      const s = listening.requested.shift();
      showError('listen-error', message.error);
      if (!message.error) {
        listening.settings = s;
        $('listen-info').textContent =
            `Listening at ${s.sampleRateHz} Hz for ${s.scheme}${s.crc ? ' with CRC' : ''}` +
            `${s.hotsound ? ' after the wake-up detector' : ''}.`;
      }
      break;
    }
    case 'tokens':
      for (const token of message.tokens) addToken(token);
      break;
    case 'failed':
      stopListening();
      showError('listen-error', `The decoder did not load: ${message.message}`);
      break;
    case 'error':
      showError('listen-error', message.message);
      break;
  }
}

async function startListening() {
  showError('listen-error', '');
  let ctx, stream;
  try {
    ctx = await audioContext();
    // Voice processing would remove the near-ultrasonic band.
    stream = await navigator.mediaDevices.getUserMedia({
      audio: {echoCancellation: false, noiseSuppression: false, autoGainControl: false},
    });
  } catch (e) {
    showError('listen-error', `No microphone: ${e.message}`);
    return;
  }
  let worklet;
  try {
    worklet = new AudioWorkletNode(ctx, 'sorvel-decoder',
                                   {numberOfOutputs: 0, processorOptions: {wasmModule}});
  } catch (e) {
    stream.getTracks().forEach((track) => track.stop());
    showError('listen-error', `No decoder: ${e.message}`);
    return;
  }
  const source = ctx.createMediaStreamSource(stream);
  const analyser = ctx.createAnalyser();
  analyser.fftSize = 2048;
  analyser.smoothingTimeConstant = 0.6;
  source.connect(worklet);
  source.connect(analyser);
  listening = {stream, source, worklet, analyser, settings: null, requested: []};
  worklet.port.onmessage = onDecoderMessage;
  worklet.onprocessorerror = () => {
    stopListening();
    showError('listen-error', 'The decoder stopped with an error.');
  };
  $('listen-info').textContent = 'Starting the decoder…';
  configureDecoder();
  $('start-listen').disabled = true;
  $('stop-listen').disabled = false;
  requestAnimationFrame(drawLevel);
}

function stopListening() {
  if (!listening) return;
  listening.worklet.port.onmessage = null;
  listening.worklet.port.postMessage({type: 'close'});
  listening.source.disconnect();
  listening.stream.getTracks().forEach((track) => track.stop());
  listening = null;
  $('start-listen').disabled = false;
  $('stop-listen').disabled = true;
  $('listen-info').textContent = 'Stopped.';
}

function addToken(hex) {
  const item = document.createElement('li');
  const time = document.createElement('time');
  time.textContent = new Date().toLocaleTimeString();
  const code = document.createElement('code');
  code.textContent = hex;
  // The settings of the decoder that heard it.
  const s = listening.settings;
  const scheme = document.createElement('span');
  scheme.textContent =
      `${s.scheme}${s.crc ? ', CRC passed' : ''}${s.hotsound ? ', after wake-up' : ''}`;
  item.append(time, ' ', code, ' ', scheme);
  $('tokens').prepend(item);
}

// Power in the band (the sum over the analyser's bins), in dB full scale.
function bandLevelDb(analyser, spectrum) {
  analyser.getFloatFrequencyData(spectrum);
  const binHz = context.sampleRate / analyser.fftSize;
  const first = Math.ceil(BAND_LOW_HZ / binHz);
  const last = Math.min(spectrum.length - 1, Math.floor(BAND_HIGH_HZ / binHz));
  let power = 0;
  for (let k = first; k <= last; ++k) power += 10 ** (spectrum[k] / 10);
  const db = 10 * Math.log10(power);
  return Math.max(METER_FLOOR_DB, Number.isFinite(db) ? db : METER_FLOOR_DB);
}

const history = [];
function drawLevel() {
  if (!listening) return;
  const analyser = listening.analyser;
  const db = bandLevelDb(analyser, new Float32Array(analyser.frequencyBinCount));
  history.push(db);
  const canvas = $('level');
  if (history.length > canvas.width) history.shift();
  const g = canvas.getContext('2d');
  const h = canvas.height;
  const y = (value) => h * (value / METER_FLOOR_DB);
  g.fillStyle = '#10151c';
  g.fillRect(0, 0, canvas.width, h);
  g.strokeStyle = '#2a3441';
  g.fillStyle = '#6b7a8c';
  g.font = '10px sans-serif';
  for (let mark = -20; mark > METER_FLOOR_DB; mark -= 20) {
    g.beginPath();
    g.moveTo(0, y(mark));
    g.lineTo(canvas.width, y(mark));
    g.stroke();
    g.fillText(`${mark} dB`, 4, y(mark) - 2);
  }
  g.strokeStyle = '#4fd1c5';
  g.lineWidth = 2;
  g.beginPath();
  history.forEach((value, i) => {
    const x = canvas.width - history.length + i;
    if (i === 0) g.moveTo(x, y(value)); else g.lineTo(x, y(value));
  });
  g.stroke();
  g.lineWidth = 1;
  $('level-db').textContent = `${db.toFixed(1)} dBFS`;
  requestAnimationFrame(drawLevel);
}

function onSettingsChanged() {
  updateHint();
  configureDecoder();
}

compileModem().then(async (compiled) => {
  wasmModule = compiled;
  modem = await instantiateModem(wasmModule);
  $('play').addEventListener('click', play);
  $('stop-play').addEventListener('click', stopPlaying);
  $('start-listen').addEventListener('click', startListening);
  $('stop-listen').addEventListener('click', stopListening);
  $('scheme').addEventListener('change', onSettingsChanged);
  $('crc').addEventListener('change', onSettingsChanged);
  $('hotsound').addEventListener('change', configureDecoder);
  $('play').disabled = false;
  $('start-listen').disabled = false;
  updateHint();
  $('status').textContent = 'Ready.';
  $('status').dataset.ready = 'true';
}, (error) => {
  $('status').textContent = `The modem did not load: ${error}`;
  $('status').classList.add('error');
});
