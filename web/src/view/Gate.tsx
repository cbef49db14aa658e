// What stands before the search: signing in, or what to do when that is not possible here.
import { useEffect, useRef, useState } from 'preact/hooks';
import type { App } from '../state/app.ts';
import { Wordmark } from './icons.tsx';

export function Gate({ app }: { app: App }) {
  if (app.gate === 'loading') return null;
  return (
    <main class="gate">
      <Wordmark />
      {app.gate === 'sign-in' && <SignIn app={app} />}
      {app.gate === 'open-address' && (
        <>
          <h1>Open the printed address</h1>
          {app.ended && (
            <p role="alert">
              Your session has ended. What you were looking for is kept, and searched for again once
              you are back.
            </p>
          )}
          {app.used && !app.ended && <p role="alert">The address that brought you here has been used before.</p>}
          <p>
            This page belongs to whoever started the server. Open the address that{' '}
            <code>arbory serve</code> printed when it started: it ends with a token that lets you in.
          </p>
          <p>
            Each address works once. For another one, start the server again or send it the signal{' '}
            <code>SIGHUP</code>.
          </p>
        </>
      )}
      {app.gate === 'unreachable' && (
        <>
          <h1>No answer</h1>
          <p>{app.problem}</p>
          <button type="button" class="primary" onClick={() => void app.open()}>
            Try again
          </button>
        </>
      )}
    </main>
  );
}

function SignIn({ app }: { app: App }) {
  const first = useRef<HTMLInputElement>(null);
  const [error, setError] = useState('');
  const [busy, setBusy] = useState(false);
  useEffect(() => first.current?.focus(), []);
  const submit = async (event: SubmitEvent) => {
    event.preventDefault();
    const form = new FormData(event.currentTarget as HTMLFormElement);
    setBusy(true);
    setError('');
    try {
      await app.signIn(String(form.get('user')), String(form.get('password')));
    } catch (failure) {
      setError(failure instanceof Error ? failure.message : String(failure));
      setBusy(false);
    }
  };
  return (
    <form onSubmit={(event) => void submit(event)}>
      <h1>Sign in</h1>
      {app.ended && <p role="alert">Your session has ended. Your search is kept, and goes on once you are back.</p>}
      <label class="labelled">
        <span>User</span>
        <input ref={first} name="user" autocomplete="username" autocapitalize="none" spellcheck={false} required />
      </label>
      <label class="labelled">
        <span>Password</span>
        <input name="password" type="password" autocomplete="current-password" />
      </label>
      <button type="submit" class="primary" disabled={busy}>
        Sign in
      </button>
      <p class="wrong" role="alert">
        {error}
      </p>
    </form>
  );
}
