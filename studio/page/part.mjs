// What a clip has told, shown apart from all else.
import {html, useEffect, useErrorBoundary, useState} from './lib/htm-preact.mjs';
import {T} from './texts.mjs';

const TRIES = 5;

// What stands in it may fail over what it is told of a clip: then a line is there, until more is told, and the rest of the page stays.
export function Part({of, children}) {
  const [error, again] = useErrorBoundary();
  useEffect(() => { if (error) again(); }, [of]);
  return error ? html`<p class="error" role="alert">${T.odd}</p>` : children;
}

// A small picture of a clip, which may have to be asked for again.
export function Still({address, ...rest}) {
  const [tries, setTries] = useState(0);
  return html`<img alt="" src=${`${address}&t=${tries}`} ...${rest}
    onError=${() => tries < TRIES && setTimeout(() => setTries(tries + 1), 1000 * 2 ** tries)} />`;
}
