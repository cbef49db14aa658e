import { useEffect, useRef } from 'preact/hooks';

const KEYS = [
  ['/', 'to the search field'],
  ['Enter', 'search; in the table, open'],
  ['Ctrl Space', 'what can be written at this place; Tab takes it'],
  ['↓ ↑', 'past searches; in the table, move'],
  ['Page ↓ ↑, Home, End', 'move far'],
  ['Shift, Ctrl', 'with ↓ ↑ or a click: choose several rows'],
  ['Ctrl A', 'choose all rows'],
  ['Space', 'show or hide the details'],
  ['d', 'download; several rows as one archive'],
  ['c', 'copy the path, or those of the rows chosen'],
  ['n', 'narrow what was found'],
  ['f', 'criteria'],
  ['Esc', 'stop the search; back to the field'],
  ['?', 'this list'],
] as const;

export function Help({ close }: { close: () => void }) {
  const dialog = useRef<HTMLDialogElement>(null);
  useEffect(() => dialog.current?.showModal(), []);
  return (
    <dialog
      ref={dialog}
      aria-labelledby="keys"
      onClose={close}
      onClick={(event) => event.target === dialog.current && dialog.current?.close()}
    >
      <h2 id="keys">Keyboard</h2>
      <dl class="keys">
        {KEYS.map(([key, meaning]) => (
          <div key={key}>
            <dt>
              <kbd>{key}</kbd>
            </dt>
            <dd>{meaning}</dd>
          </div>
        ))}
      </dl>
      <form method="dialog">
        <button class="tool">Close</button>
      </form>
    </dialog>
  );
}
