// Makes the page without its data from the sources in this directory, and writes it as a C++ source.
//
//   node build.mjs OUTPUT.cpp
//
// Reads the libraries from node_modules below the working directory, which is in the build folder.
// Needs no network.
import { createHash } from "node:crypto";
import { readFile, readdir, writeFile } from "node:fs/promises";
import { createRequire } from "node:module";
import { dirname, join, relative, resolve } from "node:path";
import { fileURLToPath, pathToFileURL } from "node:url";

const sources = dirname(fileURLToPath(import.meta.url));
const libraries = resolve("node_modules");
const require = createRequire(pathToFileURL(join(resolve("."), "package.json")));
const esbuild = require("esbuild");

async function bundle(entry) {
  const built = await esbuild.build({
    entryPoints: [join(sources, entry)],
    absWorkingDir: resolve("."),
    nodePaths: [libraries],
    bundle: true,
    minify: true,
    write: false,
    metafile: true,
    format: "iife",
    target: "es2022",
    legalComments: "none", // all licenses are collected below
  });
  return { text: built.outputFiles[0].text.trim(), inputs: Object.keys(built.metafile.inputs) };
}

// The packages that are in the bundle. Their licenses ask for a notice in every copy.
function packagesOf(inputs) {
  const names = new Set();
  for (const input of inputs) {
    const path = relative(libraries, resolve(input));
    if (path.startsWith("..")) continue;
    const parts = path.split("/");
    names.add(parts[0].startsWith("@") ? `${parts[0]}/${parts[1]}` : parts[0]);
  }
  return [...names].sort();
}

// The notices, with each text once.
async function noticesOf(inputs) {
  const byText = new Map();
  for (const name of packagesOf(inputs)) {
    const directory = join(libraries, name);
    const { version } = JSON.parse(await readFile(join(directory, "package.json"), "utf8"));
    const file = (await readdir(directory)).find((entry) => /^licen[cs]e/i.test(entry));
    if (!file) throw new Error(`${name} has no license file`);
    // "--" must not occur in a comment of HTML.
    const text = (await readFile(join(directory, file), "utf8")).trim().replaceAll("--", "- -");
    byText.set(text, [...(byText.get(text) ?? []), `${name} ${version}`]);
  }
  const notices = [...byText].map(([text, names]) => `${names.join(", ")}:\n\n${text}`);
  return `This page contains these libraries.\n\n${notices.join("\n\n")}`;
}

// A text as string literals. They are short because compilers limit the length of one.
function literals(text) {
  const pieces = text.match(/[^]{1,4000}/gu);
  return pieces.map((piece) => `    R"halvox-page(${piece})halvox-page"`).join("\n");
}

const [output] = process.argv.slice(2);
const script = await bundle("page.js");
const style = await bundle("page.css");
const hash = createHash("sha256").update(script.text).digest("base64");
// Any of these texts would end the element early, or keep it from ending.
for (const { text } of [script, style]) {
  const found = text.match(/<\/(script|style)|<!--/i);
  if (found) throw new Error(`the bundle contains ${found[0]}`);
}
const notices = await noticesOf(script.inputs);
const parts = {
  STYLE: style.text,
  LICENSES: notices,
  SCRIPT: script.text,
  SCRIPT_HASH: `sha256-${hash}`,
};
const page = (await readFile(join(sources, "page.html"), "utf8")).replaceAll(
  /@(STYLE|LICENSES|SCRIPT|SCRIPT_HASH)@/g,
  (_, name) => parts[name],
);
const cut = page.indexOf("@DATA@");
const before = page.slice(0, cut);
const after = page.slice(cut + "@DATA@".length);
await writeFile(
  output,
  `// Made from tools/report by build.mjs.
#include "tools/ReportPage.h"

namespace halvox::tools {

std::string_view reportPageBeforeData() {
  static constexpr char kText[] =
${literals(before)};
  return {kText, sizeof kText - 1};
}

std::string_view reportPageAfterData() {
  static constexpr char kText[] =
${literals(after)};
  return {kText, sizeof kText - 1};
}

}  // namespace halvox::tools
`,
);
