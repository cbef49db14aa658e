// The list of past searches. It is the server's; each change is answered with what it is by then.
import * as client from '../api/client.ts';
import type { PastSearch } from '../api/types.ts';
import type { Criteria } from '../model/criteria.ts';
import { addressOf, offered, type Remembered } from '../model/history.ts';

export class Past {
  list: Remembered[] = [];
  known = false; // until then it may still come

  // `failed`: what a person asked for could not be done.
  constructor(
    private readonly everywhere: () => string[],
    private readonly changed: () => void,
    private readonly failed: (error: unknown) => void,
  ) {}

  // Suggestions are a convenience; their absence is no reason to speak, and neither is a search that
  // is not remembered.
  async load(): Promise<void> {
    await this.take(client.getPast()).catch(() => {});
    this.known = true;
    this.changed();
  }
  async add(criteria: Criteria): Promise<void> {
    const add = addressOf(criteria);
    if (add) await this.take(client.changePast({ add })).catch(() => {});
  }

  async pin({ search }: Remembered, name: string): Promise<void> {
    await this.take(client.changePast({ pin: search, name })).catch(this.failed);
  }
  async remove({ search }: Remembered): Promise<void> {
    await this.take(client.changePast({ remove: search })).catch(this.failed);
  }

  // The histories that other clients see too. True when nothing is left of any.
  async clear(): Promise<boolean> {
    const asked = [
      this.take(client.changePast({ clear: true })),
      client.clearHistory('simple'),
      client.clearHistory('advance'),
    ];
    // One that cannot be cleared keeps the others no more.
    const ends = await Promise.allSettled(asked);
    const failure = ends.find((end) => end.status === 'rejected');
    if (failure) this.failed(failure.reason);
    return !failure;
  }

  private async take(reply: Promise<{ searches: PastSearch[] }>): Promise<void> {
    this.list = offered((await reply).searches, this.everywhere());
    this.changed();
  }
}
