// Text that someone else chose: every piece is shown as text, in a direction of its own, with signs
// in place of what cannot be seen.
import { pieces, type Range } from '../model/text.ts';

export function Name({ text, ranges }: { text: string; ranges?: Range[] }) {
  return (
    <bdi>
      {pieces(text, ranges).map((piece) => {
        const inner = piece.sign ? <span class="sign">{piece.text}</span> : piece.text;
        return piece.marked ? <mark>{inner}</mark> : inner;
      })}
    </bdi>
  );
}

// A path, split after each "/" so that each name keeps its own direction.
export function Path({ path }: { path: string }) {
  return (
    <>
      {path
        .split('/')
        .slice(1)
        .map((name) => (
          <>
            <span class="slash">/</span>
            <Name text={name} />
          </>
        ))}
    </>
  );
}

// A line of a file, of which every second piece was found.
export function FoundText({ parts }: { parts: string[] }) {
  return (
    <bdi class="line">
      {parts.map((part, index) => {
        const inner = pieces(part).map((piece) =>
          piece.sign ? <span class="sign">{piece.text}</span> : piece.text,
        );
        return index % 2 === 1 ? <mark>{inner}</mark> : inner;
      })}
    </bdi>
  );
}
