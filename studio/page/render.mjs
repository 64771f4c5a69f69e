// Rendering to a file: the dialog, and the list of what is rendered.
import {html, useState} from './lib/htm-preact.mjs';
import {Dialog} from './chooser.mjs';
import {ask, leftText, stemOf, timeText} from './link.mjs';
import {T} from './texts.mjs';

export function RenderDialog({clip, folder, range, onClose}) {
  const [path, setPath] = useState(`${folder === '/' ? '' : folder}/${stemOf(clip)}-calm.mp4`);
  const [crf, setCrf] = useState('18');
  const [codec, setCodec] = useState('');
  const [preset, setPreset] = useState('');
  const [options, setOptions] = useState('');
  const [busy, setBusy] = useState(false);
  const [part, setPart] = useState(!!range);
  const [error, setError] = useState('');
  const [exists, setExists] = useState(false);
  const start = async (overwrite) => {
    const request = {op: 'render', clip: clip.id, path, crf: Number(crf), codec, preset, options: options.split(/\s+/).filter(Boolean), overwrite};
    if (part && range) Object.assign(request, {from: `${range[0]}f`, to: `${range[1] + 1}f`});
    setError('');
    setBusy(true);
    const answer = await ask(request);
    setBusy(false);
    if (!answer.error) return onClose();
    setExists(!!answer.exists);
    return setError(answer.exists ? T.replace : answer.error);
  };
  return html`
    <${Dialog} title=${T.renderTitle} onClose=${onClose}>
      <form class="render" onSubmit=${(event) => { event.preventDefault(); start(false); }}>
        <label>${T.file}<input value=${path} onInput=${(event) => { setPath(event.target.value); setExists(false); setError(''); }} spellcheck=${false} /></label>
        <label>${T.quality}<select value=${crf} onChange=${(event) => setCrf(event.target.value)}>
          ${Object.entries(T.qualities).map(([value, text]) => html`<option value=${value} selected=${value === crf}>${text}</option>`)}</select></label>
        <label>${T.codec}<select value=${codec} onChange=${(event) => setCodec(event.target.value)}>
          ${Object.entries(T.codecs).map(([value, text]) => html`<option value=${value} selected=${value === codec}>${text}</option>`)}</select></label>
        <label>${T.preset}<select value=${preset} onChange=${(event) => setPreset(event.target.value)}>
          ${Object.entries(T.presets).map(([value, text]) => html`<option value=${value} selected=${value === preset}>${text}</option>`)}</select></label>
        <label title=${T.optionsMean}>${T.options}<input value=${options} placeholder="tune=grain g=50" onInput=${(event) => setOptions(event.target.value)} spellcheck=${false} /></label>
        ${range && html`<label>${T.range}<select value=${part ? 'part' : 'all'} onChange=${(event) => setPart(event.target.value === 'part')}>
          <option value="all" selected=${!part}>${T.rangeAll}</option>
          <option value="part" selected=${part}>${T.rangePart(timeText(range[0] / clip.info.rate), timeText((range[1] + 1) / clip.info.rate))}</option></select></label>`}
        ${error && html`<p class="error" role="alert">${error}</p>`}
        <footer>${exists && html`<button type="button" disabled=${busy} onClick=${() => start(true)}>${T.replaceIt}</button>`}
          <button class="primary" disabled=${busy}>${T.startRender}</button></footer>
      </form>
    <//>`;
}

export function RenderList({renders, onClose}) {
  return html`
    <${Dialog} title=${T.renders} onClose=${onClose}>
      <ul class="renders">
        ${!renders.length && html`<li class="hint">${T.noRenders}</li>`}
        ${[...renders].reverse().map((job) => html`
          <li key=${job.number} data-state=${job.state}>
            <div><b>${job.name}</b><i title=${job.output}>${job.output}</i></div>
            <div class="bar" role="progressbar" aria-valuemin="0" aria-valuemax="100" aria-valuenow=${Math.round(job.share * 100)} aria-label=${job.name}>
              <span style=${{width: `${job.share * 100}%`}}></span></div>
            <div class="state"><span>${T.renderStates[job.state]}${job.state === 'running' ? ` ${Math.round(job.share * 100)} %` : ''}
              ${job.left !== null && job.state === 'running' ? ` · ${T.left(leftText(job.left))}` : ''}</span>
              <button class="quiet" onClick=${() => ask({op: 'end render', render: job.number})}>${['waiting', 'saving', 'running'].includes(job.state) ? T.cancel : T.forget}</button></div>
            ${job.error && html`<p class="error">${job.error}</p>`}
            ${job.notes.map((note) => html`<p class="hint">${note}</p>`)}
          </li>`)}
      </ul>
    <//>`;
}
