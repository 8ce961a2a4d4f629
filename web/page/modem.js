// Loads the WebAssembly modem from a compiled WebAssembly.Module, on the page
// or in the AudioWorklet, whose scope cannot fetch: the module is compiled
// once on the page and each side instantiates it with its own memory.
import createSorvelModule from './sorvel_web.js';

// Resolves to the bindings (encode, messageBytes, Decoder) or rejects with
// the reason the instance could not be made.
export function instantiateModem(wasmModule) {
  return new Promise((resolve, reject) => {
    createSorvelModule({
      // Without it the factory resolves the .wasm path with URL, which the
      // AudioWorklet's scope lacks; the path is never fetched.
      locateFile: (path) => path,
      instantiateWasm(imports, receiveInstance) {
        WebAssembly.instantiate(wasmModule, imports)
            .then((instance) => receiveInstance(instance), reject);
        return {};  // the exports arrive through receiveInstance
      },
    }).then(resolve, reject);
  });
}

// Fetches and compiles the module that sits beside this file.
export async function compileModem() {
  const url = new URL('sorvel_web.wasm', import.meta.url);
  const response = await fetch(url);
  if (!response.ok) throw new Error(`${url.pathname}: HTTP ${response.status}`);
  return WebAssembly.compile(await response.arrayBuffer());
}
