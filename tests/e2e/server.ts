// A real `arbory serve` in a folder of its own, for an ordinary user: when the tests run as root it
// serves nobody, so that permissions are what they are for people.
import { spawn, spawnSync, type ChildProcess } from 'node:child_process';
import * as fs from 'node:fs';
import { tmpdir } from 'node:os';
import { join } from 'node:path';

const NOBODY = 65534;
const START_MS = 20_000;

export interface Options {
  shares: Record<string, string>; // by name, folders as `Place.folder` gives them
  logins?: boolean; // as root, with people logging in by PAM
  settings?: string; // more lines of the [server] table
  top?: string; // and before it
  words?: string[]; // of the command line
}

// A folder that the server may use, removed at the end.
export class Place {
  readonly root = fs.mkdtempSync(join(tmpdir(), 'arbory-e2e-'));

  constructor() {
    fs.chmodSync(this.root, 0o755);
  }
  folder(name: string): string {
    const path = join(this.root, name);
    fs.mkdirSync(path, { recursive: true });
    return path;
  }
  // Everything made so far becomes the server user's.
  giveAway(folder: string): void {
    if (process.getuid?.() !== 0) return;
    fs.chownSync(folder, NOBODY, NOBODY);
    for (const entry of fs.readdirSync(folder, { withFileTypes: true, encoding: 'buffer' })) {
      if (entry.isDirectory()) this.giveAway(join(folder, entry.name.toString()));
    }
  }
  remove(): void {
    fs.rmSync(this.root, { recursive: true, force: true });
  }
}

export class Server {
  private constructor(
    private readonly child: ChildProcess,
    readonly address: string, // what it printed: with the token, where there is one
  ) {}

  get origin(): string {
    return new URL(this.address).origin;
  }

  static async start(place: Place, options: Options): Promise<Server> {
    const state = place.folder(options.logins ? 'state-logins' : 'state');
    const config = join(place.root, options.logins ? 'logins.toml' : 'arbory.toml');
    const shares = Object.entries(options.shares).map(([name, dir]) => `"${name}" = "${dir}"`);
    fs.writeFileSync(
      config,
      `state_dir = "${state}"\nvolumes = []\n${options.top ?? ''}[shares]\n${shares.join('\n')}\n[server]\n` +
        `listen = "127.0.0.1:0"\nweb_dir = "${process.env.ARBORY_PAGE}"\n${options.settings ?? ''}`,
    );
    const drop = process.getuid?.() === 0 && !options.logins;
    const user = drop ? ['--user', 'nobody'] : [];
    const child = spawn(process.env.ARBORY_PROGRAM!, ['serve', '--config', config, ...user, ...(options.words ?? [])], {
      stdio: ['ignore', 'pipe', 'pipe'],
      env: { PATH: process.env.PATH, HOME: state, TZ: process.env.TZ },
    });
    return new Server(child, await printedAddress(child));
  }

  // Another address, once the one before has been used.
  renewed(): Promise<string> {
    const printed = printedAddress(this.child);
    this.child.kill('SIGHUP');
    return printed;
  }

  stop(): Promise<void> {
    return stopped(this.child);
  }

  // Held still, or let go on.
  freeze(frozen = true): void {
    this.child.kill(frozen ? 'SIGSTOP' : 'SIGCONT');
  }

  // Without a word.
  kill(): void {
    this.child.kill('SIGKILL');
  }
}

// An index of the server's shares, once it is current.
export class Index {
  private constructor(private readonly child: ChildProcess) {}

  static async start(place: Place): Promise<Index> {
    const words = ['index', '--config', join(place.root, 'arbory.toml')];
    const program = process.env.ARBORY_PROGRAM!;
    const index = new Index(spawn(program, words, { stdio: 'ignore' }));
    const end = Date.now() + START_MS;
    while (spawnSync(program, [...words, '--status']).status !== 0) {
      if (Date.now() > end) throw new Error('the index is not current');
    }
    return index;
  }

  stop(): Promise<void> {
    return stopped(this.child);
  }
}

async function stopped(child: ChildProcess): Promise<void> {
  if (child.signalCode !== null || child.exitCode !== null) return;
  const ended = new Promise((done) => child.once('exit', done));
  child.kill('SIGTERM');
  await ended;
}

function printedAddress(child: ChildProcess): Promise<string> {
  return new Promise((found, failed) => {
    let said = '';
    const hear = (text: Buffer) => {
      said += text;
      const match = /Open (http:\S+)/.exec(said);
      if (match) found(match[1]!);
    };
    child.stdout!.on('data', hear);
    child.stderr!.on('data', hear);
    child.once('error', failed);
    child.once('exit', (code) => failed(new Error(`the server ended (${code}): ${said}`)));
    setTimeout(() => failed(new Error(`the server said no address: ${said}`)), START_MS).unref();
  });
}
