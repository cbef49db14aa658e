// Handing things to the person: files to keep, and text for the clipboard.

// Long enough for any browser to have begun reading the blob.
const BLOB_KEPT_MS = 60_000;

export function saveBlob(blob: Blob, name: string): void {
  const address = URL.createObjectURL(blob);
  follow(address, name);
  setTimeout(() => URL.revokeObjectURL(address), BLOB_KEPT_MS);
}

export function follow(address: string, download: string): void {
  const link = document.createElement('a');
  link.href = address;
  link.download = download;
  link.hidden = true;
  document.body.append(link);
  link.click();
  link.remove();
}

export async function copyText(text: string): Promise<boolean> {
  try {
    await navigator.clipboard.writeText(text);
    return true;
  } catch {
    return copyBySelection(text);
  }
}

// Where the page is not served over TLS, browsers offer no clipboard but this.
function copyBySelection(text: string): boolean {
  const focused = document.activeElement as HTMLElement | null;
  const area = document.createElement('textarea');
  area.value = text;
  area.className = 'visually-hidden';
  document.body.append(area);
  area.select();
  const done = document.execCommand('copy');
  area.remove();
  focused?.focus();
  return done;
}
