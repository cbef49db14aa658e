import './style/page.css';
import { render } from 'preact';
import { App } from './state/app.ts';
import { applyTheme } from './state/theme.ts';
import { Page } from './view/Page.tsx';

applyTheme();
const app = new App(() => render(<Page app={app} />, document.body));
void app.open();
