// A file chooser over the folders that the studio was started for, and the dialogs about it.
import {html, useEffect, useRef, useState} from './lib/htm-preact.mjs';
import {get} from './link.mjs';
import {T} from './texts.mjs';

export function Dialog({title, onClose, children}) {
  const dialog = useRef();
  useEffect(() => {
    dialog.current.showModal();
    return () => dialog.current?.close();
  }, []);
  return html`
    <dialog ref=${dialog} aria-label=${title} onClose=${onClose} onCancel=${onClose}
            onClick=${(event) => { if (event.target === dialog.current) onClose(); }}>
      <header><h2>${title}</h2><button class="quiet" aria-label=${T.close} onClick=${onClose}>✕</button></header>
      ${children}
    </dialog>`;
}

function size(bytes) {
  const units = ['B', 'KB', 'MB', 'GB', 'TB'];
  let i = 0;
  for (; bytes >= 1000 && i < units.length - 1; ++i) bytes /= 1000;
  return `${bytes < 10 && i > 0 ? bytes.toFixed(1) : Math.round(bytes)} ${units[i]}`;
}

// start: a folder; name: of a file that is to be written; take(path): answers with an error's text, or nothing.
export function Chooser({title, roots, start, name, action, take, onClose}) {
  const [folder, setFolder] = useState(null);
  const [path, setPath] = useState('');
  const [error, setError] = useState('');
  const [busy, setBusy] = useState(false);
  const saves = name !== undefined;
  const go = async (to) => {
    const list = await get('/api/folder', to ? {path: to} : {});
    if (list.error) return setError(list.error);
    setError('');
    setFolder(list);
    setPath(saves ? `${list.path}/${name}` : '');
    return undefined;
  };
  useEffect(() => { go(start); }, []);
  const choose = async (chosen) => {
    if (!chosen) return;
    setBusy(true);
    const trouble = await take(chosen);
    setBusy(false);
    if (trouble) setError(trouble);
  };
  const inside = (one) => `${folder.path === '/' ? '' : folder.path}/${one}`;
  return html`
    <${Dialog} title=${title} onClose=${onClose}>
      <div class="chooser">
        ${roots.length > 1 && html`<nav class="roots">${roots.map((root) => html`<button class="quiet" onClick=${() => go(root)}>${root}</button>`)}</nav>`}
        <p class="place">${folder?.path}</p>
        <ul class="files">
          ${folder?.parent && html`<li><button onClick=${() => go(folder.parent)}><b>↑</b> ${T.up}</button></li>`}
          ${folder?.folders.map((one) => html`<li><button onClick=${() => go(inside(one))}><b>▸</b> ${one}</button></li>`)}
          ${folder?.files.filter((one) => !saves || one.project).map((one) => html`<li><button disabled=${busy}
              onClick=${() => (saves ? setPath(inside(one.name)) : choose(inside(one.name)))}><b>${one.project ? '◆' : '▶'}</b> ${one.name}<i>${size(one.bytes)}</i></button></li>`)}
          ${folder && !folder.files.length && !folder.folders.length && html`<li class="hint">${T.chooserEmpty}</li>`}
        </ul>
        <form onSubmit=${(event) => { event.preventDefault(); choose(path); }}>
          <label>${T.path}<input value=${path} onInput=${(event) => setPath(event.target.value)} spellcheck=${false} /></label>
          <button class="primary" disabled=${busy || !path}>${action}</button>
        </form>
        ${error && html`<p class="error" role="alert">${error}</p>`}
      </div>
    <//>`;
}
