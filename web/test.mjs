// Bundles tests, since Node does not read TypeScript, and runs them: `node test.mjs [FOLDER [WORD
// [NAME]]]` takes the files FOLDER/NAME*.WORD.ts. Node's own runner runs and counts them.
import { build } from 'esbuild';
import { spawnSync } from 'node:child_process';
import { mkdtemp, readdir, rm } from 'node:fs/promises';
import { tmpdir } from 'node:os';
import { join } from 'node:path';

process.chdir(new URL('.', import.meta.url).pathname);
const [folder = 'test', word = 'test', only = ''] = process.argv.slice(2);
const out = await mkdtemp(join(tmpdir(), 'arbory-page-tests-'));
const tests = (await readdir(folder)).filter((name) => name.startsWith(only) && name.endsWith(`.${word}.ts`));
await build({
  entryPoints: tests.map((name) => join(folder, name)),
  absWorkingDir: process.cwd(),
  outdir: out,
  outExtension: { '.js': '.cjs' },
  bundle: true,
  platform: 'node',
  format: 'cjs',
  external: ['playwright-core', 'axe-core'],
  sourcemap: 'inline',
  logLevel: 'warning',
});
const files = tests.map((name) => join(out, name.replace(/\.ts$/, '.cjs')));
const run = spawnSync(process.execPath, ['--enable-source-maps', '--test', ...files], {
  stdio: 'inherit',
  env: { ...process.env, TZ: 'Europe/Berlin', NODE_PATH: join(process.cwd(), 'node_modules') },
});
await rm(out, { recursive: true, force: true });
process.exit(run.status ?? 1);
