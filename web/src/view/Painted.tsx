// The text of the field in its colours, beneath the field, whose own letters cannot be seen. It follows
// the field wherever that scrolls.
import type { RefObject } from 'preact';
import { useEffect, useLayoutEffect, useRef } from 'preact/hooks';
import { painted, type Query, type Span } from '../model/query.ts';

interface Props {
  input: RefObject<HTMLInputElement | null>;
  query: Query;
  forgiven?: Span | undefined;
}

export function Painted({ input, query, forgiven }: Props) {
  const text = useRef<HTMLDivElement>(null);
  const follow = () => {
    if (text.current && input.current) text.current.style.translate = `${-input.current.scrollLeft}px`;
  };
  useLayoutEffect(follow);
  useEffect(() => {
    const field = input.current!;
    // Not every browser tells when a field scrolls.
    const later = () => requestAnimationFrame(follow);
    const events = ['scroll', 'keydown', 'keyup', 'pointermove', 'pointerup', 'focus', 'blur'];
    events.forEach((name) => field.addEventListener(name, later));
    return () => events.forEach((name) => field.removeEventListener(name, later));
  }, []);
  return (
    <div class="painted" aria-hidden="true">
      <div ref={text}>
        {painted(query, forgiven).map(({ text, look, wrong }) =>
          look || wrong ? <span class={`${look} ${wrong ? 'mistaken' : ''}`}>{text}</span> : text,
        )}
      </div>
    </div>
  );
}
