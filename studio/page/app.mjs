// The page as a whole: what is selected, the play head, keys.
import {html, render, useCallback, useEffect, useMemo, useRef, useState} from './lib/htm-preact.mjs';
import {Chart} from './chart.mjs';
import {Chooser} from './chooser.mjs';
import {ClipList} from './clip_list.mjs';
import {ask, fixed, folderOf, frameAddress, leftText, percent, stemOf, timeText, useStudio} from './link.mjs';
import {Panel} from './panel.mjs';
import {Part, Still} from './part.mjs';
import {Player} from './player.mjs';
import {RenderDialog, RenderList} from './render.mjs';
import {T} from './texts.mjs';

const icon = (path) => html`<svg viewBox="0 0 14 14" aria-hidden="true"><path d=${path} /></svg>`;
const ICONS = {
  play: icon('M3 1l10 6-10 6z'),
  pause: icon('M2 1h4v12H2zM8 1h4v12H8z'),
  back: icon('M2 1h2v12H2zM12 1v12L5 7z'),
  on: icon('M10 1h2v12h-2zM2 1v12l7-6z'),
};
const MODES = ['split', 'side', 'before', 'after', 'difference', 'tracks'];

function useTheme() {
  const [theme, setTheme] = useState(localStorage.getItem('theme') || '');
  const dark = matchMedia('(prefers-color-scheme: dark)').matches;
  const shown = theme || (dark ? 'dark' : 'light');
  document.documentElement.dataset.theme = shown;
  const turn = () => {
    const next = shown === 'dark' ? 'light' : 'dark';
    localStorage.setItem('theme', next);
    setTheme(next);
  };
  return [shown, turn];
}

function Strip({clip, seek}) {
  if (!clip.picture || !clip.info) return null;
  const count = 12, last = clip.info.frames - 1;
  return html`<div class="strip" aria-hidden="true">${Array.from({length: count}, (_, i) => {
    const frame = Math.round(last * i / (count - 1));
    return html`<${Still} key=${frame} loading="lazy" address=${frameAddress(clip, 'before', frame, 96)} onClick=${() => seek(frame)} />`;
  })}</div>`;
}

function Transport({clip, frame, transport, update, mode, setMode}) {
  const info = clip.info;
  const last = info ? info.frames - 1 : 0;
  const range = transport.range;
  const strip = useMemo(() => html`<${Strip} clip=${clip} seek=${(to) => update({seek: to})} />`, [clip]);
  return html`
    <div class="transport">
      <div class="modes" role="radiogroup">
        ${MODES.map((one) => html`<button role="radio" aria-checked=${one === mode} disabled=${!clip.picture && one !== 'before'}
            onClick=${() => setMode(one)}>${T.modes[one]}</button>`)}
      </div>
      <div class="scrub">
        ${strip}
        ${range && html`<div class="range" style=${{left: `${range[0] / Math.max(last, 1) * 100}%`, right: `${100 - range[1] / Math.max(last, 1) * 100}%`}}></div>`}
        <input type="range" class="head" min="0" max=${last} step="1" value=${frame} disabled=${!info} aria-label=${T.position}
               aria-valuetext=${info ? timeText(frame / info.rate) : ''} onInput=${(event) => update({seek: Number(event.target.value)})} />
      </div>
      <div class="keys">
        <button class="round" disabled=${!info} aria-label=${T.stepBack} title=${T.stepBack} onClick=${() => update({step: -1})}>${ICONS.back}</button>
        <button class="round primary" disabled=${!info} aria-label=${transport.speed ? T.pause : T.play} title=${T.keys} onClick=${() => update({toggle: true})}>${transport.speed ? ICONS.pause : ICONS.play}</button>
        <button class="round" disabled=${!info} aria-label=${T.stepOn} title=${T.stepOn} onClick=${() => update({step: 1})}>${ICONS.on}</button>
        <output>${info ? timeText(frame / info.rate) : '0:00.00'} <i>/ ${info ? timeText(info.frames / info.rate) : '0:00.00'} · ${frame}</i></output>
        <span class="gap"></span>
        ${range && html`<button class="quiet" onClick=${() => update({range: null})}>${T.clearRange}</button>`}
        <button class="quiet" disabled=${!info} title="I" onClick=${() => update({mark: 'in'})}>${T.inPoint}</button>
        <button class="quiet" disabled=${!info} title="O" onClick=${() => update({mark: 'out'})}>${T.outPoint}</button>
        <label class="quiet"><input type="checkbox" checked=${transport.loop} onChange=${(event) => update({loop: event.target.checked})} /> ${T.loop}</label>
      </div>
    </div>`;
}

function Progress({shown, cancel}) {
  const share = shown?.share;
  const stage = shown ? T.stages[shown.stage] || shown.stage : T.working;
  return html`
    <div class="progress">
      <div><b>${stage}</b> <span>${share !== undefined ? `${Math.round(share * 100)} %` : ''}${shown?.left ? ` · ${T.left(leftText(shown.left))}` : ''}</span>
        <button onClick=${cancel}>${T.cancel}</button></div>
      <div class=${`bar ${share === undefined ? 'unknown' : ''}`} role="progressbar" aria-label=${stage} aria-valuemin="0" aria-valuemax="100" aria-valuenow=${Math.round((share || 0) * 100)}>
        <span style=${{width: `${(share ?? 0.3) * 100}%`}}></span></div>
      ${shown?.says ? html`<p class="hint">${shown.says}</p>` : ''}
    </div>`;
}

function Summary({clip}) {
  const choice = clip.shots?.[0]?.choice;
  const outcome = clip.outcome;
  return html`
    <section class="summary">
      ${clip.state === 'working' || clip.state === 'opening' ? html`<${Progress} shown=${clip.progress} cancel=${() => ask({op: 'cancel', clip: clip.id})} />`
        : clip.state !== 'ready' ? html`<button class="primary wide" onClick=${() => ask({op: clip.state === 'failed' || clip.state === 'closed' ? 'open' : 'analyze', clip: clip.id})}>
            ${clip.state === 'failed' || clip.state === 'closed' ? T.again : T.analyze}</button>` : ''}
      ${clip.error && html`<p class="error" role="alert">${clip.error}</p>`}
      ${outcome && clip.state !== 'failed' && html`
        <dl>
          <div><dt>${T.facts[0]}</dt><dd>${fixed(outcome.shake_before, 1)} <i>→</i> ${fixed(outcome.shake_after, 1)}</dd></div>
          <div><dt>${T.facts[1]}</dt><dd>${percent(outcome.width_kept)} %</dd></div>
          <div><dt>${T.facts[2]}</dt><dd>${fixed(outcome.most_zoom, 2)}×</dd></div>
          <div><dt>${T.facts[3]}</dt><dd>${percent(outcome.most_black, 1)} %</dd></div>
        </dl>`}
      ${choice && !clip.settings.window.as_set && clip.state !== 'failed' && html`
        <p class="hint"><b>${T.chosen}:</b> ${choice.text}${choice.why ? `; ${choice.why}` : ''}.</p>
        ${choice.candidates.length > 1 && html`
          <details class="ways"><summary>${T.otherWays}</summary><ul>
            ${choice.candidates.map((way, i) => html`<li class=${way.taken ? 'taken' : ''}><span><b>${way.name}</b><i>${T.shake(fixed(way.shake_before, 1), fixed(way.shake_after, 1))} · ${T.kept(percent(way.width_kept))}</i></span>
              ${way.taken ? html`<em>${T.taken}</em>` : way.window === 'follow' ? html`<button class="quiet" title=${way.bends ? '' : T.unbent} onClick=${() => ask({op: 'way', clip: clip.id, way: i})}>${T.takeWay}</button>` : ''}</li>`)}
          </ul></details>`}`}
      ${clip.settings.window.as_set && clip.state === 'ready' && html`<p class="hint">${T.byHand}</p>`}
      ${(clip.warnings || []).map((line) => html`<p class="warning">${line}</p>`)}
    </section>`;
}

// sample: how the drawing of the sample clip stands.
function Empty({sample, open, trySample}) {
  const draws = sample?.share !== undefined;
  return html`
    <main class="empty"><h1>${T.title}</h1>
      <ol>${T.welcome.map((line) => html`<li>${line}</li>`)}</ol>
      ${draws ? html`<${Progress} shown=${{stage: 'drawing', share: sample.share}} cancel=${() => ask({op: 'end sample'})} />`
        : html`<div class="starts"><button class="primary" onClick=${open}>${T.open}</button><button onClick=${trySample}>${T.trySample}</button></div>`}
      ${sample?.error && html`<p class="error" role="alert">${sample.error}</p>`}</main>`;
}

function App() {
  const studio = useStudio();
  const [theme, turnTheme] = useTheme();
  const [selected, setSelected] = useState(location.hash.slice(1));
  const [mode, setMode] = useState('split');
  const [dialog, setDialog] = useState('');
  const [tab, setTab] = useState('controls');
  const [note, setNote] = useState('');
  const [frame, setFrame] = useState(0);
  const [, redraw] = useState(0);
  const transport = useRef({frame: 0, speed: 0, range: null, loop: true, seek: 0}).current;
  const clip = studio.clips[selected] && studio.order.includes(selected) ? studio.clips[selected] : null;

  // Selected, and not heard of yet.
  const awaited = useRef('');
  if (clip) awaited.current = '';
  const select = useCallback((id) => {
    awaited.current = id;
    setSelected(id);
    history.replaceState(null, '', `#${id}`);
    Object.assign(transport, {frame: 0, speed: 0, range: null});
    setFrame(0);
    ask({op: 'open', clip: id});
  }, []);
  useEffect(() => {
    if (studio.loaded && !clip && !awaited.current && studio.order.length) select(studio.order[0]);
  }, [studio.loaded, studio.order, clip]);
  // A page that was reloaded, or a studio that was started again.
  useEffect(() => { if (clip?.state === 'closed') ask({op: 'open', clip: clip.id}); }, [clip?.id, clip?.state]);

  const update = useCallback((change) => {
    const of = live.current.clip;
    const last = of?.info ? of.info.frames - 1 : 0;
    const to = (at) => {
      transport.frame = Math.min(last, Math.max(0, at));
      ++transport.seek;
      setFrame(transport.frame);
    };
    if ('seek' in change) to(change.seek);
    if ('step' in change) { transport.speed = 0; to(transport.frame + change.step); }
    if (change.toggle) {
      if (!transport.speed && transport.frame >= (transport.range?.[1] ?? last)) to(transport.range?.[0] ?? 0);
      transport.speed = transport.speed ? 0 : 1;
    }
    if ('speed' in change) transport.speed = change.speed;
    if (change.mark) {
      const [a, b] = transport.range || [0, last];
      transport.range = change.mark === 'in' ? [transport.frame, Math.max(transport.frame, b)] : [Math.min(a, transport.frame), transport.frame];
    }
    if ('range' in change) transport.range = change.range;
    if ('loop' in change) transport.loop = change.loop;
    redraw((n) => n + 1);
  }, []);
  const live = useRef({});
  Object.assign(live.current, {clip, dialog, mode});

  useEffect(() => {
    const onKey = (event) => {
      const of = live.current.clip;
      if (!of || live.current.dialog) return;
      const command = event.ctrlKey || event.metaKey;
      const key = event.key.toLowerCase();
      if (command && key === 'z') { event.preventDefault(); ask({op: event.shiftKey ? 'redo' : 'undo', clip: of.id}); return; }
      if (command && key === 'y') { event.preventDefault(); ask({op: 'redo', clip: of.id}); return; }
      if (command && key === 's') { event.preventDefault(); setDialog('save'); return; }
      if (command || event.altKey) return;
      const target = event.target;
      const types = target.matches?.('input:not([type=range]):not([type=checkbox]), textarea, select');
      const moves = target.matches?.('input[type=range]:not(.head), [role=tab]');
      if (types) return;
      const on = {
        ' ': () => !target.matches?.('button, summary, input[type=checkbox]') && update({toggle: true}),
        k: () => update({toggle: true}),
        j: () => update({speed: transport.speed < 0 ? transport.speed * 2 : -1}),
        l: () => update({speed: transport.speed > 0 ? Math.min(8, transport.speed * 2) : 1}),
        arrowleft: () => !moves && update({step: event.shiftKey ? -10 : -1}),
        arrowright: () => !moves && update({step: event.shiftKey ? 10 : 1}),
        home: () => !moves && update({seek: 0}),
        end: () => !moves && update({seek: Infinity}),
        i: () => update({mark: 'in'}),
        o: () => update({mark: 'out'}),
      }[key];
      const number = Number(key);
      if (on) {
        if (on() !== false) event.preventDefault();
      } else if (number >= 1 && number <= MODES.length) {
        setMode(MODES[number - 1]);
      }
    };
    addEventListener('keydown', onKey);
    return () => removeEventListener('keydown', onKey);
  }, []);

  // A path that is dropped, or a file, of which a browser tells the name alone.
  const onDrop = async (event) => {
    event.preventDefault();
    const text = event.dataTransfer.getData('text/plain').trim().replace(/^file:\/\//, '');
    const [file] = event.dataTransfer.files;
    if (text) openPath(decodeURI(text));
    else if (file) openPath('', file.name);
  };
  const openPath = async (path, name) => {
    const answer = await ask(path ? {op: 'add', path} : {op: 'find', name});
    if (answer.error) { setNote(answer.error); return answer.error; }
    setDialog('');
    setNote('');
    select(answer.clip);
    return '';
  };
  const trySample = async () => {
    const answer = await ask({op: 'sample'});
    if (answer.error) setNote(answer.error);
    else if (answer.clip) select(answer.clip);
  };
  const save = async (path) => {
    let answer = await ask({op: 'save', clip: clip.id, path});
    if (answer.exists && confirm(T.replace)) answer = await ask({op: 'save', clip: clip.id, path, overwrite: true});
    if (answer.error) return answer.error;
    setDialog('');
    setNote(T.saved(path));
    return '';
  };
  const running = studio.renders.filter((job) => ['waiting', 'saving', 'running'].includes(job.state));
  // What a frame that goes by doesn't change.
  const list = useMemo(() => html`<${ClipList} studio=${studio} selected=${clip?.id} select=${select} open=${() => setDialog('open')} />`,
                       [studio.heard, clip?.id]);
  const side = useMemo(() => clip && html`
    <aside class="side" aria-label=${T.controls}>
      <${Part} of=${clip}><${Summary} clip=${clip} /><//>
      <${Part} key=${clip.id} of=${clip}><${Panel} clip=${clip} /><//>
    </aside>`, [clip]);
  const folder = clip && folderOf(clip, studio.roots);
  const isEmpty = studio.loaded && !studio.order.length;
  return html`
    <div class="frame" onDragOver=${(event) => event.preventDefault()} onDrop=${onDrop} data-tab=${tab}>
      <header class="top">
        <strong>${T.title}</strong>
        <span class="gap"></span>
        ${clip && html`
          <button class="quiet" disabled=${!clip.can_undo} onClick=${() => ask({op: 'undo', clip: clip.id})} aria-label=${T.undo} title=${T.undo}>↶</button>
          <button class="quiet" disabled=${!clip.can_redo} onClick=${() => ask({op: 'redo', clip: clip.id})} aria-label=${T.redo} title=${T.redo}>↷</button>
          <button disabled=${clip.state !== 'ready'} onClick=${() => setDialog('save')}>${T.save}</button>
          <button class="primary" disabled=${clip.state !== 'ready'} onClick=${() => setDialog('render')}>${T.render}</button>`}
        ${(!isEmpty || studio.renders.length > 0) && html`
          <button class="quiet" onClick=${() => setDialog('renders')}>${T.renders}${running.length ? ` (${running.length})` : ''}</button>`}
        <button class="quiet" aria-label=${T.theme} title=${T.theme} onClick=${turnTheme}>${theme === 'dark' ? '☀' : '☾'}</button>
      </header>
      ${!studio.connected && html`<p class="banner" role="alert">${T.lost}</p>`}
      ${studio.trouble && html`<p class="banner" role="alert">${studio.trouble}</p>`}
      ${note && html`<p class="banner note" role="status">${note} <button class="quiet" aria-label=${T.close} onClick=${() => setNote('')}>✕</button></p>`}
      ${isEmpty ? html`<${Empty} sample=${studio.sample} open=${() => setDialog('open')} trySample=${trySample} />` : html`
        <div class="body">
          ${list}
          ${clip && html`
            <main class="centre">
              <${Part} key=${`${clip.id} picture`} of=${clip}><${Player} clip=${clip} frame=${frame} mode=${clip.picture ? mode : 'before'} transport=${transport} onFrame=${setFrame} onStop=${() => update({speed: 0})} /><//>
              <${Part} of=${clip}><${Transport} clip=${clip} frame=${frame} transport=${transport} update=${update} mode=${clip.picture ? mode : 'before'} setMode=${setMode} /><//>
              <${Part} key=${`${clip.id} chart`} of=${clip}><${Chart} clip=${clip} frame=${frame} seek=${(to) => update({seek: to})} theme=${theme} /><//>
            </main>
            <nav class="switch" role="tablist" aria-label=${T.narrowTabs}>
              ${[['controls', T.controls], ['motion', T.motion], ['clips', T.clips]].map(([one, text]) => html`<button role="tab" aria-selected=${tab === one} onClick=${() => setTab(one)}>${text}</button>`)}
            </nav>
            ${side}`}
        </div>`}
      ${dialog === 'open' && html`<${Chooser} title=${T.chooserTitle} roots=${studio.roots} start=${folder} action=${T.openIt} take=${openPath} onClose=${() => setDialog('')} />`}
      ${dialog === 'save' && clip && html`<${Chooser} title=${T.chooserSave} roots=${studio.roots} start=${folder} name=${`${stemOf(clip)}.calm`} action=${T.saveIt} take=${save} onClose=${() => setDialog('')} />`}
      ${dialog === 'render' && clip && html`<${RenderDialog} clip=${clip} folder=${folder} range=${transport.range} onClose=${() => setDialog('')} />`}
      ${dialog === 'renders' && html`<${RenderList} renders=${studio.renders} onClose=${() => setDialog('')} />`}
    </div>`;
}

document.title = T.title;
render(html`<${App} />`, document.getElementById('app'));
