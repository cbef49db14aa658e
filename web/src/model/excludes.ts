// What a query leaves out: its terms `exclude:NAME,...`. They stay what they are, text of the query;
// here they are found in it, added and taken out.

// Folders full of files that nobody looks for.
export const USUAL_EXCLUDES = ['@eaDir', '.git', 'node_modules'] as const;

const WORD = 'exclude:';

// The terms of the pattern with the blanks behind each; blanks in quotes end none.
function termsOf(pattern: string): string[] {
  return pattern.match(/\s*(?:\\.|"(?:\\.|[^"\\])*"?|\S)+\s*|\s+/g) ?? [];
}

function namesOf(term: string): string[] | null {
  const word = term.trim();
  if (!word.toLowerCase().startsWith(WORD)) return null;
  return word.slice(WORD.length).match(/(?:\\.|"(?:\\.|[^"\\])*"?|[^,])+/g) ?? [];
}

// As they are written.
export function excludesOf(pattern: string): string[] {
  return termsOf(pattern).flatMap((term) => namesOf(term) ?? []);
}

export function withExclude(pattern: string, name: string): string {
  return excludesOf(pattern).includes(name) ? pattern : `${pattern.trimEnd()} ${WORD}${name}`.trimStart();
}

export function withoutExclude(pattern: string, name: string): string {
  const kept = termsOf(pattern).map((term) => {
    const names = namesOf(term);
    if (!names?.includes(name)) return term;
    const others = names.filter((other) => other !== name);
    return others.length > 0 ? term.replace(/\S.*\S/s, WORD + others.join()) : ' ';
  });
  return kept.join('').replace(/^\s+|\s+$/g, '');
}
