// Drawn around tracks over their picture: what is inside can be deleted.
import {html, useEffect, useRef, useState} from './lib/htm-preact.mjs';
import {ask} from './link.mjs';
import {T} from './texts.mjs';

const NEAR = 0.004;     // of the picture: closer corners are one
const MOST = 400;       // corners
const STEP = 0.02;

const rectangle = ([left, top, right, bottom]) => [[left, top], [right, top], [right, bottom], [left, bottom]];

export function Lasso({clip, frame, playing}) {
  const box = useRef();
  const [corners, setCorners] = useState([]);
  const [sides, setSides] = useState(null);  // of a rectangle that the keyboard moves
  const [drawing, setDrawing] = useState(false);
  const [places, setPlaces] = useState([]);
  const [error, setError] = useState('');
  const lasso = (rest) => ask({op: 'lasso', clip: clip.id, frame, corners, ...rest});

  // What is inside; of a frame that is left it isn't told any more.
  useEffect(() => {
    setPlaces([]);
    if (drawing || corners.length < 3 || playing) return undefined;
    let wanted = true;
    lasso({}).then((answer) => wanted && setPlaces(answer.places || []));
    return () => { wanted = false; };
  }, [clip.id, clip.picture, frame, corners, drawing, playing]);

  const at = (event) => {
    const bounds = box.current.getBoundingClientRect();
    const share = (value) => Math.min(1, Math.max(0, value));
    return [share((event.clientX - bounds.left) / bounds.width), share((event.clientY - bounds.top) / bounds.height)];
  };
  const clear = () => { setCorners([]); setSides(null); setError(''); };
  const onDown = (event) => {
    event.currentTarget.setPointerCapture(event.pointerId);
    clear();
    setDrawing(true);
    setCorners([at(event)]);
  };
  const onMove = (event) => {
    if (!drawing) return;
    const point = at(event), last = corners[corners.length - 1];
    if (corners.length < MOST && Math.hypot(point[0] - last[0], point[1] - last[1]) > NEAR) setCorners([...corners, point]);
  };
  const remove = async (any) => {
    const answer = await lasso({any_frame: any, deletes: true});
    if (answer.error) setError(answer.error);
    else clear();
    // The button that was pressed is gone: by the keyboard it goes on from here.
    box.current?.focus();
  };
  const restore = async () => {
    await ask({op: 'restore tracks', clip: clip.id});
    box.current?.focus();
  };
  const onKey = (event) => {
    const by = {ArrowLeft: [-STEP, 0], ArrowRight: [STEP, 0], ArrowUp: [0, -STEP], ArrowDown: [0, STEP]}[event.key];
    if (event.key === 'Enter') {
      setSides([0.4, 0.4, 0.6, 0.6]);
      setCorners(rectangle([0.4, 0.4, 0.6, 0.6]));
    } else if (by && sides) {
      const [left, top, right, bottom] = sides;
      const moved = event.shiftKey ? [left, top, Math.max(left + STEP, right + by[0]), Math.max(top + STEP, bottom + by[1])]
        : [left + by[0], top + by[1], right + by[0], bottom + by[1]];
      setSides(moved);
      setCorners(rectangle(moved));
    } else if (event.key === 'Escape') {
      clear();
    } else if ((event.key === 'Delete' || event.key === 'Backspace') && corners.length > 2) {
      remove(event.shiftKey);
    } else {
      return;
    }
    event.stopPropagation();
    event.preventDefault();
  };
  return html`
    <div class="lasso" ref=${box} role="application" tabindex="0" aria-label=${T.lasso}
         onPointerDown=${onDown} onPointerMove=${onMove} onPointerUp=${() => setDrawing(false)} onKeyDown=${onKey}>
      <svg viewBox="0 0 1 1" preserveAspectRatio="none" aria-hidden="true">
        ${corners.length > 1 && html`<polygon points=${corners.map((corner) => corner.join(',')).join(' ')} />`}</svg>
      ${places.slice(0, 600).map(([x, y]) => html`<i style=${{left: `${x * 100}%`, top: `${y * 100}%`}}></i>`)}
    </div>
    <div class="lassoed">
      ${corners.length > 2 && !drawing ? html`
        <output>${T.chosenTracks(places.length)}</output>
        <button title=${T.deleteMeans} disabled=${!places.length} onClick=${() => remove(false)}>${T.deleteHere}</button>
        <button title=${T.deleteAllMeans} onClick=${() => remove(true)}>${T.deleteAll}</button>`
        : html`<span>${T.lasso}</span>`}
      ${clip.deleted > 0 && html`<span>${T.deletedTracks(clip.deleted)}</span>
        <button onClick=${restore}>${T.restoreTracks}</button>`}
      ${error && html`<b role="alert">${error}</b>`}
    </div>`;
}
