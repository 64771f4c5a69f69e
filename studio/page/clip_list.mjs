// The clips that are open, with what became of each.
import {html, useState} from './lib/htm-preact.mjs';
import {ask, frameAddress} from './link.mjs';
import {T} from './texts.mjs';

export function facts(outcome) {
  return T.shake(outcome.shake_before.toFixed(1), outcome.shake_after.toFixed(1));
}

function Thumbnail({clip}) {
  const [broken, setBroken] = useState(0);
  // Not of clips that nobody opened in this run: each would start a process.
  const is_there = clip.info && clip.state !== 'closed' && clip.state !== 'failed';
  if (!is_there) return html`<span class="thumb"></span>`;
  return html`<span class="thumb"><img alt="" src=${`${frameAddress(clip, 'before', 0, 160)}&t=${broken}`}
    onError=${() => broken < 3 && setTimeout(() => setBroken(broken + 1), 1000)} /></span>`;
}

export function ClipList({studio, selected, select, open}) {
  return html`
    <aside class="clips" aria-label=${T.clips}>
      <header><h2>${T.clips}</h2><button class="quiet" onClick=${open}>${T.openShort}</button></header>
      <ul>
        ${studio.order.map((id) => studio.clips[id]).filter(Boolean).map((clip) => html`
          <li key=${clip.id} class=${clip.id === selected ? 'selected' : ''}>
            <button class="clip" aria-current=${clip.id === selected ? 'true' : 'false'} onClick=${() => select(clip.id)} title=${clip.path}>
              <${Thumbnail} clip=${clip} />
              <span class="about"><b>${clip.name}</b>
                <i class=${clip.state === 'failed' || clip.error ? 'bad' : ''}>${clip.state === 'working' && clip.progress
                  ? `${T.stages[clip.progress.stage] || clip.progress.stage} ${clip.progress.share !== undefined ? Math.round(clip.progress.share * 100) + ' %' : ''}`
                  : clip.outcome && clip.state !== 'failed' ? facts(clip.outcome) : T.states[clip.state] || clip.state}</i></span>
              ${clip.state === 'working' && html`<span class="bar"><span style=${{width: `${(clip.progress?.share || 0) * 100}%`}}></span></span>`}
            </button>
            <button class="quiet remove" aria-label=${`${T.remove}: ${clip.name}`} title=${T.remove} onClick=${() => ask({op: 'remove', clip: clip.id})}>✕</button>
          </li>`)}
      </ul>
    </aside>`;
}
