// Line drawings on a 16 pixel grid, in the colour of the text around them.
import { extensionOf } from '../model/text.ts';

const DRAWINGS = {
  folder: 'M1.75 12.500v-9h4.500l1.500 2h6.500v7a.75.75 0 0 1-.75.75h-11a.75.75 0 0 1-.75-.75Z',
  file: 'M3.500 14.250V1.750h6l3 3v9.500ZM9.250 2v3h3',
  document: 'M3.500 14.250V1.750h6l3 3v9.500ZM9.250 2v3h3M5.750 7.750h4.500M5.750 10.250h4.500',
  image: 'M2 3h12v10H2ZM2.250 11.500l3.500-3.500 2.500 2.500 2-2 3.500 3.500M10.500 6h.01',
  video: 'M2 3h12v10H2ZM6.750 6v4l3.250-2Z',
  audio: 'M5.500 12V3.500l7-1.500v8.500M5.500 12a1.750 1.500 0 1 1-3.500 0 1.750 1.500 0 0 1 3.500 0ZM12.500 10.500a1.750 1.500 0 1 1-3.500 0 1.750 1.500 0 0 1 3.500 0Z',
  archive: 'M2.500 5.500h11v8h-11ZM1.750 2.500h12.500v3H1.750ZM6.500 8.250h3',
  code: 'M5.250 4.500 1.750 8l3.500 3.500M10.750 4.500l3.500 3.500-3.500 3.500',
  search: 'M7 12A5 5 0 1 0 7 2a5 5 0 0 0 0 10ZM10.750 10.750l3.500 3.500',
  close: 'M3.500 3.500l9 9M12.500 3.500l-9 9',
  down: 'M3.750 6 8 10.250 12.250 6',
  right: 'M6 3.750 10.250 8 6 12.250',
  up: 'M3.750 10 8 5.750 12.250 10',
  download: 'M8 2v8M4.750 7 8 10.250 11.250 7M2.500 13.500h11',
  copy: 'M5.500 5.500v-3h8v8h-3M2.500 5.500h8v8h-8Z',
  clock: 'M8 14A6 6 0 1 0 8 2a6 6 0 0 0 0 12ZM8 4.750V8l2.250 1.500',
  columns: 'M2 2.500h12v11H2ZM6 2.500v11M10 2.500v11',
  check: 'M2 2.500h12v11H2ZM5 8l2.250 2.250L11.250 5.750',
  pencil: 'M3 13l.5-3 7-7 2.500 2.500-7 7ZM9 4.500 11.500 7',
  pin: 'M5.500 2.500h5l-.5 4 2 2.500H4l2-2.500ZM8 9v5',
  sliders: 'M2 4.500h6M12 4.500h2M10 6.250a1.750 1.750 0 1 0 0-3.500 1.750 1.750 0 0 0 0 3.500ZM2 11.500h2M8 11.500h6M6 13.250a1.750 1.750 0 1 0 0-3.500 1.750 1.750 0 0 0 0 3.500Z',
  warning: 'M8 2 1.500 13.500h13ZM8 6.500v3.250M8 11.750h.01',
  more: 'M3.250 8h.01M8 8h.01M12.750 8h.01',
  open: 'M9.500 2.500h4v4M13.500 2.500 7.500 8.500M11.500 9v4.500h-9v-9H7',
} as const;

export type IconName = keyof typeof DRAWINGS;

export function Icon({ name, size = 16 }: { name: IconName; size?: number }) {
  return (
    <svg class="icon" stroke-width="1.4" viewBox="0 0 16 16" width={size} height={size} aria-hidden="true">
      <path d={DRAWINGS[name]} stroke-width={name === 'more' ? 2.2 : undefined} />
    </svg>
  );
}

const BY_EXTENSION = new Map<string, IconName>();
function teach(name: IconName, extensions: string): void {
  for (const extension of extensions.split(' ')) BY_EXTENSION.set(extension, name);
}
teach('image', 'jpg jpeg png gif webp avif heic heif tif tiff bmp svg ico raw cr2 cr3 nef arw dng psd xcf');
teach('video', 'mp4 mkv avi mov webm wmv mpg mpeg m4v 3gp ts mts m2ts vob ogv flv');
teach('audio', 'mp3 flac ogg oga opus m4a aac wav wma aiff aif mid midi ape');
teach('document', 'pdf txt md doc docx odt rtf xls xlsx ods csv ppt pptx odp epub tex log pages numbers');
teach('archive', 'zip tar gz tgz bz2 xz 7z rar zst lz4 lzma iso jar deb rpm cab');
teach('code', 'c h cc cpp hpp cxx js mjs ts tsx jsx py rs go java kt rb php sh bash pl lua cs swift html css scss json yaml yml toml xml sql cmake');

export function iconOf(name: string, isFolder: boolean): IconName {
  return isFolder ? 'folder' : (BY_EXTENSION.get(extensionOf(name)) ?? 'file');
}

export function Wordmark() {
  return (
    <span class="wordmark">
      <svg viewBox="0 0 20 24" width="17" height="20" aria-hidden="true">
        <path d="M4 2v15a4 4 0 0 0 4 4h3M4 9h6" />
        <circle cx="14" cy="9" r="3.200" />
        <circle cx="14.500" cy="21" r="1.200" class="dot" />
      </svg>
      Arbory
    </span>
  );
}
