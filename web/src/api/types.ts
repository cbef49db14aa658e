// What the server replies.
import type { Span } from '../model/query.ts';

export interface FileRow {
  name: string;
  path: string;
  path_encoded?: string; // of one that is no text, in its bytes
  is_dir: boolean;
  size?: number;
  type?: string;
  owner?: { user: string; group: string };
  time?: { mtime: number; atime: number; ctime: number; crtime: number };
}

export interface Page {
  files: FileRow[];
  total: number;
  offset: number;
  finished: boolean;
}

export interface Started {
  taskid: string;
  has_not_index_share: boolean;
}

export interface Walk {
  phase: 'names' | 'contents' | 'done';
  folders: number;
  entries: number;
  matches: number;
  skipped: { permission: number; vanished: number; other: number };
  files: { unreadable: number; not_text: number };
  source?: 'index' | 'walk' | 'both'; // where names came from, and a few words why
  index?: string;
  fleet?: Fleet;
}

// Of a search that asks other machines: how many, and those that have not answered.
export interface Fleet {
  total: number;
  answered: number;
  boxes: { name: string; state: 'late' | 'down' | 'refused' | 'old'; why: string }[];
}

export interface Progress {
  taskid: string;
  finished: boolean;
  progress: number; // 0 running or stopped, 1 done, -1 failed
  errno?: number;
  walk?: Partial<Walk>;
}

// What about something that was typed cannot be understood.
export interface Wrong {
  wrong: { criterion: string; sentence: string };
  spans?: Span[];
}

// What a query is understood to be, and what can be written where the caret stands.
export interface Read {
  spans: Span[];
  wrong?: { sentence: string };
  completion?: Completion;
}

export interface Completion {
  of: 'prefix' | 'value' | 'share'; // of shares the page knows which
  begin: number;
  end: number;
  items: { text: string; about: string }[];
}

// A search that was begun: what was typed as the parameters of its start, and what it had found by
// then, where that could be listed.
export interface Begun {
  taskid: string;
  params: Record<string, unknown>;
  spans: Span[];
  page?: Partial<Page>;
}

// What an index knows of a question at once; or what about it cannot be understood.
export type InstantAnswer =
  | {
      index: string; // "current", or a few words why it does not answer
      rows: { path: string; path_encoded?: string; name: string; is_dir: boolean; size: number; mtime: number }[];
      found: number; // matches looked up
      more: boolean; // there may be more
      wrong?: undefined;
    }
  | Wrong;

// Where a file's contents hold what a pattern asks for: pieces of the line, every second one found.
export interface FoundLine {
  line: number | null;
  parts: string[];
  text?: { first_line: number; text: string; before: boolean; after: boolean } | null;
}

// What a search that found nothing came close to.
export interface Misses {
  complete: boolean;
  entries: number;
  folders: number;
  left_out: number;
  meant: string; // the pattern as other programs would have understood it; often empty
  terms: { written: string; without: number; names: string[] }[];
}

export interface Session {
  user: string;
  mode: 'single' | 'login';
  version?: string;
}

export interface Share {
  name: string;
  indexed: boolean;
}

export interface Shares {
  shares: Share[];
  homes: boolean;
}

export type HistoryKind = 'simple' | 'advance';

// A search made on the page before, by what stands in its address; with a name it is pinned.
export interface PastSearch {
  at: number;
  search: string;
  name?: string;
}
