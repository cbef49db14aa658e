// Bundles the page into dist/: index.html, app.js, app.css and the icon, and nothing that is fetched
// from elsewhere. `node build.mjs --watch` rebuilds as files change.
import { context } from 'esbuild';
import { copyFile, mkdir, rm } from 'node:fs/promises';

const options = {
  entryPoints: { app: 'src/main.tsx' },
  outdir: 'dist',
  bundle: true,
  format: 'esm',
  target: ['chrome111', 'firefox113', 'safari16.4'],
  jsx: 'automatic',
  jsxImportSource: 'preact',
  minify: true,
  legalComments: 'none',
  logLevel: 'warning',
};

process.chdir(import.meta.dirname ?? new URL('.', import.meta.url).pathname);
await rm('dist', { recursive: true, force: true });
await mkdir('dist', { recursive: true });
const bundle = await context(options);
await bundle.rebuild();
for (const name of ['index.html', 'icon.svg']) await copyFile(`src/${name}`, `dist/${name}`);
if (process.argv.includes('--watch')) {
  await bundle.watch();
} else {
  await bundle.dispose();
}
