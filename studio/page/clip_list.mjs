// The clips that are open, with what became of each.
import {html} from './lib/htm-preact.mjs';
import {ask, fixed, frameAddress} from './link.mjs';
import {Part, Still} from './part.mjs';
import {T} from './texts.mjs';

function facts(outcome) {
  return T.shake(fixed(outcome.shake_before, 1), fixed(outcome.shake_after, 1));
}

function Thumbnail({clip}) {
  // Not of clips that nobody opened in this run: each would start a process.
  const is_there = clip.info && clip.state !== 'closed' && clip.state !== 'failed';
  return html`<span class="thumb">${is_there && html`<${Still} address=${frameAddress(clip, 'before', 0, 160)} />`}</span>`;
}

function About({clip}) {
  return html`
    <i class=${clip.state === 'failed' || clip.error ? 'bad' : ''}>${clip.state === 'working' && clip.progress
      ? `${T.stages[clip.progress.stage] || clip.progress.stage} ${clip.progress.share !== undefined ? Math.round(clip.progress.share * 100) + ' %' : ''}`
      : clip.outcome && clip.state !== 'failed' ? facts(clip.outcome) : T.states[clip.state] || clip.state}</i>`;
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
              <span class="about"><b>${clip.name}</b><${Part} of=${clip}><${About} clip=${clip} /><//></span>
              ${clip.state === 'working' && html`<span class="bar"><span style=${{width: `${(clip.progress?.share || 0) * 100}%`}}></span></span>`}
            </button>
            <button class="quiet remove" aria-label=${`${T.remove}: ${clip.name}`} title=${T.remove} onClick=${() => ask({op: 'remove', clip: clip.id})}>✕</button>
          </li>`)}
      </ul>
    </aside>`;
}
