// Bundles the unit tests, since Node does not read TypeScript, and runs them with its own runner.
import { build } from 'esbuild';
import { spawnSync } from 'node:child_process';
import { mkdtemp, readdir, rm } from 'node:fs/promises';
import { tmpdir } from 'node:os';
import { join } from 'node:path';

process.chdir(new URL('.', import.meta.url).pathname);
const out = await mkdtemp(join(tmpdir(), 'arbory-page-tests-'));
const tests = (await readdir('test')).filter((name) => name.endsWith('.test.ts'));
await build({
  entryPoints: tests.map((name) => `test/${name}`),
  outdir: out,
  outExtension: { '.js': '.mjs' },
  bundle: true,
  platform: 'node',
  format: 'esm',
  sourcemap: 'inline',
  logLevel: 'warning',
});
const files = tests.map((name) => join(out, name.replace(/\.ts$/, '.mjs')));
const run = spawnSync(process.execPath, ['--enable-source-maps', '--test', ...files], {
  stdio: 'inherit',
  env: { ...process.env, TZ: 'Europe/Berlin' },
});
await rm(out, { recursive: true, force: true });
process.exit(run.status ?? 1);
