// Opens the built page in headless Chromium whose fake microphone plays a
// looped broadcast that `sorvel encode` wrote, and checks that the page
// decodes the token in its AudioWorklet and answers bad settings with a
// message.
//
//   SORVEL_WEB_DIST  the built page (default build-web/dist)
//   SORVEL_BIN       the host `sorvel` tool (default build/tools/sorvel)
//   SORVEL_OUT       where the WAV and screenshots go (default out)
//   CHROMIUM         the browser (default /usr/bin/chromium)
import {after, before, test} from 'node:test';
import assert from 'node:assert/strict';
import {execFileSync} from 'node:child_process';
import {createReadStream, existsSync, mkdirSync, mkdtempSync, rmSync, statSync} from 'node:fs';
import {createServer} from 'node:http';
import {tmpdir} from 'node:os';
import path from 'node:path';
import puppeteer from 'puppeteer-core';

const root = path.resolve(path.dirname(new URL(import.meta.url).pathname), '../..');
const dist = path.resolve(root, process.env.SORVEL_WEB_DIST ?? 'build-web/dist');
const sorvel = path.resolve(root, process.env.SORVEL_BIN ?? 'build/tools/sorvel');
const out = path.resolve(root, process.env.SORVEL_OUT ?? 'out');
const chromium = process.env.CHROMIUM ?? '/usr/bin/chromium';

// "Sorvel" with two CRC bytes: the default 8-byte DSSS token.
const MESSAGE = '536f7276656c';
const DECODE_TIMEOUT_MS = 60000;

const TYPES = {
  '.html': 'text/html; charset=utf-8',
  '.js': 'text/javascript; charset=utf-8',
  '.css': 'text/css; charset=utf-8',
  '.wasm': 'application/wasm',
};

let server, browser, page, profile, baseUrl;
const pageErrors = [];
const foreignRequests = [];  // anything not from our server: the page works offline

// Serves `dist` on the loopback interface (a secure context, which the
// AudioWorklet needs).
function serve() {
  server = createServer((request, response) => {
    const name = decodeURIComponent(new URL(request.url, 'http://x').pathname);
    const file = path.join(dist, name === '/' ? 'index.html' : name);
    if (!file.startsWith(dist + path.sep) || !existsSync(file) || !statSync(file).isFile()) {
      response.writeHead(404).end();
      return;
    }
    response.writeHead(200, {'Content-Type': TYPES[path.extname(file)] ?? 'application/octet-stream'});
    createReadStream(file).pipe(response);
  });
  return new Promise((resolve) => server.listen(0, '127.0.0.1', () => resolve(server.address().port)));
}

before(async () => {
  assert.ok(existsSync(path.join(dist, 'sorvel_web.wasm')), `no page in ${dist}: run make web`);
  assert.ok(existsSync(sorvel), `no ${sorvel}: build the sorvel tool`);
  mkdirSync(out, {recursive: true});
  const wav = path.join(out, 'web-broadcast.wav');
  execFileSync(sorvel, ['encode', '--token', MESSAGE, '--crc', '--loop', '8', '-o', wav]);

  baseUrl = `http://127.0.0.1:${await serve()}`;
  profile = mkdtempSync(path.join(tmpdir(), 'sorvel-chromium-'));
  browser = await puppeteer.launch({
    executablePath: chromium,
    headless: true,
    userDataDir: profile,
    args: [
      '--headless', '--no-sandbox', '--disable-gpu', '--disable-quic', '--no-first-run',
      '--disable-background-networking', '--disable-component-update', '--disable-sync',
      '--use-fake-device-for-media-stream', '--use-fake-ui-for-media-stream',
      `--use-file-for-fake-audio-capture=${wav}`, '--autoplay-policy=no-user-gesture-required',
    ],
  });
  page = await browser.newPage();
  await page.setViewport({width: 1100, height: 900});
  page.on('pageerror', (error) => pageErrors.push(error.message));
  page.on('requestfailed', (request) => pageErrors.push(`request failed: ${request.url()}`));
  page.on('request', (request) => {
    if (!request.url().startsWith(`${baseUrl}/`)) foreignRequests.push(request.url());
  });
  await page.goto(`${baseUrl}/`, {waitUntil: 'load'});
  await page.waitForSelector('#status[data-ready="true"]', {timeout: 20000});
});

after(async () => {
  await browser?.close();
  server?.close();
  if (profile) rmSync(profile, {recursive: true, force: true});
});

const text = (selector) => page.$eval(selector, (e) => e.textContent);
const visible = (selector) => page.$eval(selector, (e) => !e.hidden);

test('the page decodes the token its microphone hears', {timeout: 2 * DECODE_TIMEOUT_MS + 10000}, async () => {
  await page.click('#start-listen');
  await page.waitForFunction(
      (message) => [...document.querySelectorAll('#tokens code')].some((c) => c.textContent === message),
      {timeout: DECODE_TIMEOUT_MS}, MESSAGE);
  assert.match(await text('#listen-info'), /Listening at \d+ Hz for dsss with CRC/);
  assert.equal(await visible('#listen-error'), false);
  // The meter has drawn a level for the band the broadcast fills.
  assert.match(await text('#level-db'), /-?\d+\.\d dBFS/);

  // Behind the wake-up detector: a rebuilt decoder reports the token again.
  await page.click('#hotsound');
  await page.waitForFunction(
      () => /after the wake-up detector/.test(document.getElementById('listen-info').textContent));
  await page.waitForFunction(
      (message) => [...document.querySelectorAll('#tokens code')]
                       .filter((c) => c.textContent === message).length === 2,
      {timeout: DECODE_TIMEOUT_MS}, MESSAGE);
  assert.match(await text('#tokens li:first-child'), /dsss, CRC passed, after wake-up/);
  await page.click('#hotsound');
  await page.screenshot({path: path.join(out, 'web-page.png'), fullPage: true});

  // Stopping closes the worklet's decoder; listening again starts a new one.
  await page.click('#stop-listen');
  assert.equal(await text('#listen-info'), 'Stopped.');
  await page.click('#start-listen');
  await page.waitForFunction(
      () => /^Listening at \d+ Hz for dsss with CRC\.$/.test(document.getElementById('listen-info').textContent),
      {timeout: 10000});
  assert.equal(await visible('#listen-error'), false);
});

test('bad settings show a message and leave the page working', async () => {
  const tryPlay = async ({token, loop = '5', scheme = 'dsss'}) => {
    await page.select('#scheme', scheme);
    await page.$eval('#token', (e, v) => { e.value = v; }, token);
    await page.$eval('#loop', (e, v) => { e.value = v; }, loop);
    await page.click('#play');
    await page.waitForFunction(() => !document.getElementById('send-error').hidden ||
                                     document.getElementById('send-info').textContent !== '');
  };
  // The messages are the module's own (web_modem_test.cc covers them); here
  // they must reach the page, the one from the page's script included.
  const cases = [
    {input: {token: '53zz72'}, message: /'z' is not a hex digit/},
    {input: {token: MESSAGE, scheme: 'dtmf'}, message: /dtmf scheme sends 5-byte tokens, so give 3/},
    {input: {token: MESSAGE, loop: 'x'}, message: /loop must be a number/},
  ];
  for (const {input, message} of cases) {
    await tryPlay(input);
    assert.equal(await visible('#send-error'), true, JSON.stringify(input));
    assert.match(await text('#send-error'), message);
  }
  await page.screenshot({path: path.join(out, 'web-page-error.png'), fullPage: true});

  // Valid settings again: the message goes and the token plays.
  await tryPlay({token: '536f72', scheme: 'dtmf'});
  assert.equal(await visible('#send-error'), false);
  assert.match(await text('#send-info'), /Playing \d+\.\d\d s at \d+ Hz/);
  // The decoder followed the scheme change and still listens.
  await page.waitForFunction(
      () => /for dtmf with CRC\./.test(document.getElementById('listen-info').textContent));
  // A receiver setting the decoder refuses: it keeps listening as it was.
  await page.click('#hotsound');
  await page.waitForFunction(() => !document.getElementById('listen-error').hidden);
  assert.match(await text('#listen-error'), /the wake-up detector works with the dsss scheme/);
  assert.match(await text('#listen-info'), /for dtmf with CRC\./);
  await page.click('#hotsound');
  await page.waitForFunction(() => document.getElementById('listen-error').hidden);
  assert.deepEqual(pageErrors, []);
  assert.deepEqual(foreignRequests, []);
});

test('the module answers bad arguments with messages, not exceptions', async () => {
  const answers = await page.evaluate(async (message) => {
    const {compileModem, instantiateModem} = await import('./modem.js');
    const modem = await instantiateModem(await compileModem());
    const decoder = new modem.Decoder();
    const result = {
      hugeRate: modem.encode({sampleRateHz: 1e20}, message, 0).error,
      oddRate: modem.encode({sampleRateHz: 44100.5}, message, 0).error,
      schemeType: modem.encode({scheme: 7}, message, 0).error,
      tokenType: modem.encode({crc: true}, 42, 0).error,
      loopType: modem.encode({crc: true}, message, 'x').error,
      good: modem.encode({crc: true, sampleRateHz: 48000}, message, 0).pcm16.length,
      unconfigured: decoder.process(new Float32Array(4096)).length,
      unconfiguredFinish: decoder.finish().length,
      lowRate: decoder.configure({sampleRateHz: 22050}),
      notFloats: decoder.process([1, 2, 3]).length,
      // The buffer the block is copied into shrinks and grows with it.
      short: decoder.process(new Float32Array(16)).length,
      long: decoder.process(new Float32Array(8192)).length,
    };
    decoder.delete();
    return result;
  }, MESSAGE);
  assert.match(answers.hugeRate, /sampleRateHz must be a whole number in \[8000, 192000\]/);
  assert.match(answers.oddRate, /sampleRateHz must be a whole number/);
  assert.match(answers.schemeType, /scheme must be a string/);
  assert.match(answers.tokenType, /token must be a string/);
  assert.match(answers.loopType, /loop must be a number of seconds/);
  assert.ok(answers.good > 0);
  assert.equal(answers.unconfigured, 0);
  assert.equal(answers.unconfiguredFinish, 0);
  assert.match(answers.lowRate, /22050 Hz rate cannot carry the 18500 Hz carrier/);
  assert.equal(answers.notFloats, 0);
  assert.equal(answers.short, 0);
  assert.equal(answers.long, 0);
  assert.deepEqual(pageErrors, []);
});

test('the decoder worklet answers misuse with messages', async () => {
  const answers = await page.evaluate(async () => {
    const {compileModem} = await import('./modem.js');
    const ctx = new AudioContext();
    await ctx.audioWorklet.addModule('decoder_worklet.js');
    // Collects the node's messages until `count` have come or a second passes.
    const messages = (node, count) => new Promise((resolve) => {
      const seen = [];
      const done = () => resolve(seen);
      node.port.onmessage = (event) => {
        seen.push(event.data);
        if (seen.length === count) done();
      };
      setTimeout(done, 1000);
    });
    const noModule = new AudioWorkletNode(ctx, 'sorvel-decoder', {numberOfOutputs: 0});
    const withoutModule = await messages(noModule, 1);

    const node = new AudioWorkletNode(ctx, 'sorvel-decoder',
                                      {numberOfOutputs: 0, processorOptions: {wasmModule: await compileModem()}});
    // Sent before the module is ready: answered in order once it is.
    node.port.postMessage({type: 'configure', settings: {sampleRateHz: 22050}});
    node.port.postMessage({type: 'configure', settings: 'dsss'});
    node.port.postMessage({type: 'configure', settings: {scheme: 'dtmf', crc: true}});
    node.port.postMessage(new Float32Array(128));
    node.port.postMessage({type: 'close'});
    node.port.postMessage({type: 'configure', settings: {}});
    const answered = await messages(node, 6);
    await ctx.close();
    return {withoutModule, answered};
  });
  assert.equal(answers.withoutModule.length, 1);
  assert.equal(answers.withoutModule[0].type, 'failed');
  assert.match(answers.withoutModule[0].message, /processorOptions.wasmModule must be a WebAssembly.Module/);
  const [ready, lowRate, notObject, good, notConfigure, closed] = answers.answered;
  assert.deepEqual(ready, {type: 'ready'});
  assert.equal(lowRate.type, 'configured');
  assert.match(lowRate.error, /22050 Hz rate cannot carry the 18500 Hz carrier/);
  assert.deepEqual(notObject, {type: 'configured', error: 'settings must be an object'});
  assert.deepEqual(good, {type: 'configured', error: ''});
  assert.equal(notConfigure.type, 'error');
  assert.match(notConfigure.message, /takes \{type: "configure", settings\}/);
  assert.deepEqual(closed, {type: 'error', message: 'the decoder is closed'});
  assert.equal(answers.answered.length, 6);
  assert.deepEqual(pageErrors, []);
});
