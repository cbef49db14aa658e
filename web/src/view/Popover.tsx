// A button that unfolds a panel under itself. The panel closes on Escape, on a click elsewhere and
// when the focus leaves; Escape gives the focus back to the button.
import type { ComponentChildren } from 'preact';
import { useEffect, useRef, useState } from 'preact/hooks';

interface Props {
  label: ComponentChildren;
  title?: string;
  className?: string;
  panelClass?: string;
  panelLabel: string;
  children: (close: () => void) => ComponentChildren;
}

export function Popover({ label, title, className = '', panelClass = '', panelLabel, children }: Props) {
  const [open, setOpen] = useState(false);
  const root = useRef<HTMLDivElement>(null);
  const button = useRef<HTMLButtonElement>(null);
  const close = () => {
    setOpen(false);
    button.current?.focus();
  };

  useEffect(() => {
    if (!open) return;
    const outside = (event: Event) => {
      if (!root.current?.contains(event.target as Node)) setOpen(false);
    };
    addEventListener('pointerdown', outside, true);
    addEventListener('focusin', outside);
    return () => {
      removeEventListener('pointerdown', outside, true);
      removeEventListener('focusin', outside);
    };
  }, [open]);

  const onKeyDown = (event: KeyboardEvent) => {
    if (event.key !== 'Escape' || !open) return;
    event.stopPropagation();
    close();
  };

  return (
    <div class="popover" ref={root} onKeyDown={onKeyDown}>
      <button
        type="button"
        ref={button}
        class={className}
        title={title}
        aria-label={title}
        aria-expanded={open}
        aria-haspopup="dialog"
        onClick={() => setOpen(!open)}
      >
        {label}
      </button>
      {open && (
        <div class={`panel ${panelClass}`} role="dialog" aria-label={panelLabel}>
          {children(close)}
        </div>
      )}
    </div>
  );
}
