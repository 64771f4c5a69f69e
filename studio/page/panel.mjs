// The effect's rows, as the effect declares them, and what is shown of each frame.
import {html, useEffect, useRef, useState} from './lib/htm-preact.mjs';
import {ask, useDocument} from './link.mjs';
import {T} from './texts.mjs';

// A value that follows the studio's, but not while a hand is on it.
function useHeld(value, send) {
  const [held, setHeld] = useState(null);
  const timer = useRef(), sent = useRef(-Infinity);
  useEffect(() => { if (held !== null && Math.abs(held - value) < 1e-9) setHeld(null); }, [value]);
  // The first change at once, those that follow quickly some 25 a second.
  const change = (next) => {
    setHeld(next);
    clearTimeout(timer.current);
    timer.current = setTimeout(() => {
      sent.current = performance.now();
      send(next);
      timer.current = setTimeout(() => setHeld(null), 3000);
    }, Math.max(0, sent.current + 40 - performance.now()));
  };
  return [held === null ? value : held, change];
}

function Slider({row, value, change, label}) {
  const step = 10 ** -(row.digits ?? 0);
  const [typed, setTyped] = useState(null);
  const least = Math.min(row.from, value), most = Math.max(row.to, value);
  const take = () => {
    const number = Number(typed);
    if (typed !== null && typed.trim() !== '' && Number.isFinite(number)) {
      change(Math.min(row.max, Math.max(row.min, number)));
    }
    setTyped(null);
  };
  return html`
    <input type="range" min=${least} max=${most} step=${step} value=${value} disabled=${!row.enabled} aria-label=${label}
           onInput=${(event) => change(Number(event.target.value))}
           style=${{'--part': `${(value - least) / Math.max(most - least, 1e-9) * 100}%`}} />
    <span class="number"><input inputmode="decimal" disabled=${!row.enabled} aria-label=${`${label}, number`}
           value=${typed ?? value.toFixed(row.digits ?? 0)}
           onInput=${(event) => setTyped(event.target.value)} onBlur=${take}
           onKeyDown=${(event) => { if (event.key === 'Enter') take(); }} />${row.percent ? html`<i>%</i>` : ''}</span>`;
}

function Row({clip, row}) {
  const set = clip.settings.controls[row.id];
  const given = set ?? row.default;
  // What was chosen beside the controls shows in the effect's own value.
  const [value, change] = useHeld(set ?? row.value ?? given,
    (next) => ask({op: 'control', clip: clip.id, control: row.id, value: next}));
  const changed = set !== undefined && Math.abs(set - row.default) > 1e-6;
  const name = row.name;
  return html`
    <div class=${`row ${row.kind} ${changed ? 'changed' : ''}`} data-control=${row.id}>
      <span class="name" title=${name}>${name}</span>
      ${row.kind === 'slider' && html`<${Slider} row=${row} value=${value} change=${change} label=${name} />`}
      ${row.kind === 'popup' && html`
        <select disabled=${!row.enabled} aria-label=${name} value=${value} onChange=${(event) => change(Number(event.target.value))}>
          ${row.items.map((item, i) => item === '(-' ? null : html`<option value=${i + 1} selected=${value === i + 1}>${item}</option>`)}
        </select>`}
      ${row.kind === 'checkbox' && html`
        <input type="checkbox" disabled=${!row.enabled} aria-label=${name} checked=${value !== 0}
               onChange=${(event) => change(event.target.checked ? 1 : 0)} />`}
      <button class="quiet reset" aria-label=${T.reset(name)} title=${T.reset(name)} disabled=${!changed}
              onClick=${() => ask({op: 'reset', clip: clip.id, control: row.id})}>↺</button>
    </div>`;
}

// Rows between a group's start and its end, nested.
function tree(rows) {
  const top = {rows: []};
  const open = [top];
  for (const row of rows) {
    if (row.kind === 'group') {
      const group = {...row, rows: []};
      open[open.length - 1].rows.push(group);
      open.push(group);
    } else if (row.kind === 'end') {
      if (open.length > 1) open.pop();
    } else {
      open[open.length - 1].rows.push(row);
    }
  }
  return top.rows;
}

function Group({clip, group}) {
  return html`
    <details open=${!group.closed} class="group">
      <summary>${group.name}</summary>
      ${group.rows.map((row) => row.rows ? html`<${Group} key=${row.id} clip=${clip} group=${row} />`
        : row.kind === 'button' ? null : html`<${Row} key=${row.id} clip=${clip} row=${row} />`)}
    </details>`;
}

function WindowRows({clip}) {
  const shown = clip.settings.window;
  const set = (name, value) => ask({op: 'window', clip: clip.id, name, value});
  const select = (name, options, otherwise) => html`
    <select aria-label=${name === 'kind' ? T.windowKind : T.still} value=${shown[name] ?? otherwise}
            onChange=${(event) => set(name, event.target.value === otherwise ? null : event.target.value)}>
      ${Object.entries(options).map(([value, text]) => html`<option value=${value} selected=${(shown[name] ?? otherwise) === value}>${text}</option>`)}
    </select>`;
  const number = (name, label, otherwise, least, most, step) => html`
    <input type="number" min=${least} max=${most} step=${step} aria-label=${label} value=${shown[name] ?? ''} placeholder=${otherwise}
           onChange=${(event) => set(name, event.target.value === '' ? null : Math.min(most, Math.max(least, Number(event.target.value))))} />`;
  return html`
    <details open class="group">
      <summary>${T.window}</summary>
      <label class="row check" title=${T.chooseMeans}><span class="name">${T.choose}</span>
        <input type="checkbox" aria-label=${T.choose} checked=${!shown.as_set} onChange=${(event) => set('as_set', event.target.checked ? null : true)} /></label>
      <div class="row"><span class="name">${T.windowKind}</span>${select('kind', T.windowKinds, 'auto')}</div>
      <div class="row"><span class="name">${T.still}</span>${select('still', T.stills, 'auto')}</div>
      <div class="row"><span class="name">${T.zoomAtMost}</span>${number('most_zoom', T.zoomAtMost, '1.5', 1, 100, 0.05)}</div>
      <div class="row"><span class="name">${T.zoomSpeed}</span>${number('zoom_speed', T.zoomSpeed, '5', 0, 1000, 1)}</div>
    </details>`;
}

export function Panel({clip}) {
  const [experts, setExperts] = useState(false);
  const panel = useDocument('/api/panel', clip.id, clip.panel);
  if (!panel) return html`<div class="panel"><p class="hint">${clip.state === 'failed' ? '' : T.opening}</p></div>`;
  const rows = panel.rows.filter((row) => experts || !row.expert);
  return html`
    <div class="panel">
      <${WindowRows} clip=${clip} />
      ${tree(rows).map((row) => row.rows ? html`<${Group} key=${row.id} clip=${clip} group=${row} />`
        : row.kind === 'button' ? null : html`<${Row} key=${row.id} clip=${clip} row=${row} />`)}
      <label class="row check experts"><span class="name">${T.experts}</span>
        <input type="checkbox" checked=${experts} onChange=${(event) => setExperts(event.target.checked)} /></label>
    </div>`;
}
