// Bundles the page into dist/: index.html, and beside it in assets/ the script, the style sheet and
// the icon under names that tell their content, so that a browser may keep them for good. Nothing in
// them is fetched from elsewhere. Each file stands there compressed too, under its name and ".gz".
import { build } from 'esbuild';
import { readFile, rm, writeFile } from 'node:fs/promises';
import { basename } from 'node:path';
import { constants, gzipSync } from 'node:zlib';

process.chdir(new URL('.', import.meta.url).pathname);
await rm('dist', { recursive: true, force: true });
const { metafile } = await build({
  entryPoints: ['src/main.tsx', 'src/icon.svg'],
  absWorkingDir: process.cwd(),
  outdir: 'dist/assets',
  entryNames: '[name]-[hash]',
  loader: { '.svg': 'copy' },
  bundle: true,
  format: 'esm',
  target: ['chrome123', 'firefox120', 'safari17.5'],
  jsx: 'automatic',
  jsxImportSource: 'preact',
  minify: true,
  metafile: true,
  legalComments: 'none',
  logLevel: 'warning',
});
let html = await readFile('src/index.html', 'utf8');
for (const path of Object.keys(metafile.outputs)) {
  const [, name, ending] = /^(.*)-[A-Z0-9]+(\.\w+)$/.exec(basename(path));
  html = html.replaceAll(`"${name}${ending}"`, `"assets/${basename(path)}"`);
}
await writeFile('dist/index.html', html);
for (const path of ['dist/index.html', ...Object.keys(metafile.outputs)]) {
  const packed = gzipSync(await readFile(path), { level: constants.Z_BEST_COMPRESSION });
  await writeFile(path + '.gz', packed);
}
