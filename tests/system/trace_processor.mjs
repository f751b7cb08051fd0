// node trace_processor.mjs ENGINE TRACE <queries
// Imports a trace with Perfetto's trace processor, the program behind its viewer, and answers SQL
// queries. ENGINE is the directory that perfetto.py unpacks. Reads a JSON array of queries and writes
// a JSON array of their results: each an array of rows, each row an object. Numbers that JSON readers
// would round, such as times, are texts.
import { readFileSync } from 'node:fs';
import path from 'node:path';
import { pathToFileURL } from 'node:url';
import vm from 'node:vm';

const [engineDirectory, trace] = process.argv.slice(2);

// The engine is built for a worker of a browser. It loads its WebAssembly with a synchronous request.
globalThis.self = globalThis;
globalThis.WorkerGlobalScope = class {};
Object.defineProperty(globalThis, 'location', {
  value: { href: 'file:///engine/' }, configurable: true, writable: true,
});
globalThis.XMLHttpRequest = class {
  open(method, url) {
    this.file = path.basename(url);
  }
  send() {
    const bytes = readFileSync(path.join(engineDirectory, this.file));
    this.status = 200;
    this.response = bytes.buffer.slice(bytes.byteOffset, bytes.byteOffset + bytes.byteLength);
  }
};
// The engine reports its progress and fields of newer versions there.
console.log = console.warn = () => {};

vm.runInThisContext(readFileSync(path.join(engineDirectory, 'engine_bundle.node.js'), 'utf8'));
const start = self.onmessage;
self.onmessage = null;

const { EngineBase } = await import(
  pathToFileURL(path.resolve(engineDirectory, 'engine.mjs')).href);

class Engine extends EngineBase {
  mode = 'WASM';
  id = 'test';
  constructor(port) {
    super();
    this.port = port;
    port.onmessage = (message) => this.onRpcResponseBytes(message.data);
  }
  rpcSendRequestBytes(bytes) {
    this.port.postMessage(bytes);
  }
}

// The engine sets up its memory in a microtask after its start.
await new Promise((resolve) => setImmediate(resolve));
const { port1, port2 } = new MessageChannel();
start({ data: port1 });
const engine = new Engine(port2);
await engine.parse(new Uint8Array(readFileSync(trace)));
await engine.notifyEof();

const results = [];
for (const sql of JSON.parse(readFileSync(0, 'utf8'))) {
  const result = await engine.query(sql);
  const rows = [];
  for (const row = result.iter({}); row.valid(); row.next()) {
    rows.push(Object.fromEntries(result.columns().map((name) => {
      const value = row.get(name);
      const isExact = typeof value !== 'bigint' || Number.isSafeInteger(Number(value));
      return [name, isExact ? (typeof value === 'bigint' ? Number(value) : value) : `${value}`];
    })));
  }
  results.push(rows);
}
process.stdout.write(JSON.stringify(results));
port1.close();
port2.close();
