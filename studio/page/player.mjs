// The picture: before and after, playing or still.
import {html, useEffect, useRef, useState} from './lib/htm-preact.mjs';
import {Lasso} from './lasso.mjs';
import {frameAddress} from './link.mjs';
import {T} from './texts.mjs';

const AHEAD = 10;       // frames that are fetched ahead of the play head
const AT_ONCE = 4;      // requests
const KEPT = 90;        // decoded pictures
const WIDEST_PLAYING = 960;

export const SIDES = {split: 'both', side: 'both', difference: 'both', before: 'before', after: 'after', tracks: 'tracks'};

// Pictures by their address, fetched in the order of their need.
class Pictures {
  constructor(arrived) {
    this.arrived = arrived;
    this.held = new Map();
    this.running = new Map();
    this.refused = new Map();
  }

  get(address) {
    const picture = this.held.get(address);
    if (picture) {  // the youngest again
      this.held.delete(address);
      this.held.set(address, picture);
    }
    return picture;
  }

  // What is wanted now, the most wanted first. What runs for something else is dropped, unless that
  // may still be shown.
  want(addresses, keeps) {
    if (!keeps) {
      for (const [address, abort] of this.running) {
        if (!addresses.includes(address)) abort.abort();
      }
    }
    const now = performance.now();
    for (const address of addresses) {
      if (this.running.size >= AT_ONCE) return;
      if (this.held.has(address) || this.running.has(address)) continue;
      if ((this.refused.get(address) || 0) > now) continue;
      this.fetch(address);
    }
  }

  async fetch(address) {
    const abort = new AbortController();
    this.running.set(address, abort);
    try {
      const response = await fetch(address, {signal: abort.signal});
      if (!response.ok) {
        // Busy: later; gone: much later.
        this.refused.set(address, performance.now() + (response.status === 503 ? 150 : 5000));
        await response.arrayBuffer();
      } else {
        const picture = await createImageBitmap(await response.blob());
        this.held.set(address, picture);
        this.refused.delete(address);
        while (this.held.size > KEPT) {
          const [oldest, dropped] = this.held.entries().next().value;
          this.held.delete(oldest);
          dropped.close();
        }
      }
    } catch {
      this.refused.set(address, performance.now() + 500);
    }
    this.running.delete(address);
    this.arrived();
  }
}

function fit(canvas, width, height) {
  if (canvas.width !== width || canvas.height !== height) {
    canvas.width = width;
    canvas.height = height;
  }
}

// Draws one picture; `both`: it has before above after, or `before` is a picture of its own.
function paint(canvas, picture, before, mode, both, divider) {
  const width = picture.width, height = both && !before ? picture.height / 2 : picture.height;
  const context = canvas.getContext('2d', {alpha: false});
  if (!both) {
    fit(canvas, width, height);
    context.drawImage(picture, 0, 0);
    return;
  }
  const first = before || picture;
  const after = [0, before ? 0 : height, width, height];
  if (mode === 'side') {
    fit(canvas, 2 * width + 4, height);
    context.fillStyle = '#000';
    context.fillRect(0, 0, canvas.width, height);
    context.drawImage(first, 0, 0, width, height, 0, 0, width, height);
    context.drawImage(picture, ...after, width + 4, 0, width, height);
    return;
  }
  fit(canvas, width, height);
  context.globalCompositeOperation = 'source-over';
  if (mode === 'difference') {
    context.drawImage(first, 0, 0, width, height, 0, 0, width, height);
    context.globalCompositeOperation = 'difference';
    context.drawImage(picture, ...after, 0, 0, width, height);
    context.globalCompositeOperation = 'source-over';
    return;
  }
  const left = Math.round(width * divider);
  context.drawImage(picture, ...after, 0, 0, width, height);
  if (left > 0) context.drawImage(first, 0, 0, left, height, 0, 0, left, height);
}

// transport: {frame, speed, range: [in, out], loop}, shared with the page; onFrame(frame): it moved.
export function Player({clip, mode, frame, transport, onFrame, onStop}) {
  const box = useRef(), canvas = useRef();
  const live = useRef({});
  const [divider, setDivider] = useState(0.5);
  Object.assign(live.current, {clip, mode, transport, onFrame, onStop, divider});

  useEffect(() => {
    const engine = live.current;
    let ended = false, dirty = true;
    engine.pictures = new Pictures(() => { dirty = true; });
    let shown = null, started = null, lastSpeed = 0, rate = [], drawn = '';
    // While it plays: every so many frames are fetched, as many as come in time.
    let stride = 1, late = 0, weighed = 0;

    const step = (now) => {
      if (ended) return;
      requestAnimationFrame(step);
      const {clip: of, transport: how} = engine;
      if (!of?.info || document.hidden) return;
      const frames = of.info.frames;
      // By the clock, so that what comes late is left out.
      if (how.speed !== lastSpeed || (how.speed && started?.seek !== how.seek)) {
        started = {now, frame: how.frame, seek: how.seek};
        lastSpeed = how.speed;
        rate = [];
        late = 0;
      }
      if (how.speed) {
        const [first, last] = how.range || [0, frames - 1];
        let frame = started.frame + Math.floor((now - started.now) / 1000 * of.info.rate * how.speed);
        if (frame > last || frame < first) {
          if (how.loop) {
            frame = how.speed > 0 ? first : last;
            started = {now, frame, seek: how.seek};
          } else {
            frame = frame > last ? last : first;
            engine.onStop();
          }
        }
        if (frame !== how.frame) {
          how.frame = frame;
          engine.onFrame(frame);
          dirty = true;
        }
      }
      const ready = of.state === 'ready' || (of.picture && of.shots?.length);
      const wanted = ready ? engine.mode : 'before';
      const side = SIDES[wanted];
      const columns = wanted === 'side' ? 2 : 1;
      const room = Math.max(160, box.current.clientWidth / columns * devicePixelRatio);
      const still = !how.speed;
      const limit = Math.min(of.info.shown_width, still ? 1920 : WIDEST_PLAYING);
      // In steps, so that a window's size by itself makes no new pictures.
      const width = Math.min(limit, Math.ceil(room / 160) * 160);
      // Apart where it stands still: of a change the steady one alone is fetched.
      const apart = still && side === 'both';
      const address = (frame) => frameAddress(of, apart ? 'after' : side, frame, width);
      const other = apart ? frameAddress(of, 'before', how.frame, width) : '';
      const list = [];
      let onView = address(how.frame);
      if (how.speed) {
        const sign = Math.sign(how.speed), by = stride * Math.max(1, Math.abs(how.speed));
        const first = Math.ceil(how.frame / by) * by;
        for (let i = 0; i < AHEAD; ++i) {
          const frame = first + sign * i * by;
          if (frame >= 0 && frame < frames) list.push(address(frame));
        }
        // The nearest that is there, as long as it isn't far behind.
        for (let back = 0; back <= 2 * of.info.rate; ++back) {
          const near = address(how.frame - sign * back);
          if (engine.pictures.held.has(near)) {
            onView = near;
            break;
          }
        }
        if (!engine.pictures.held.has(onView)) ++late;
        if (now - weighed > 500) {
          if (late > 3 && stride < 8) ++stride;
          else if (late === 0 && stride > 1 && list.slice(0, 5).every((one) => engine.pictures.held.has(one))) --stride;
          late = 0;
          weighed = now;
        }
      } else {
        stride = 1;
        list.push(onView);
        if (other) list.push(other);
      }
      engine.pictures.want(list, how.speed !== 0);
      const picture = engine.pictures.get(onView);
      const before = other && engine.pictures.get(other);
      const key = `${onView} ${wanted} ${engine.divider}`;
      if (picture && (!other || before) && (key !== drawn || dirty)) {
        if (onView !== shown) {
          rate.push(now);
          while (rate.length && now - rate[0] > 2000) rate.shift();
        }
        shown = onView;
        drawn = key;
        paint(canvas.current, picture, before, wanted, side === 'both', engine.divider);
        canvas.current.dataset.shown = onView;
        canvas.current.dataset.rate = rate.length > 1
          ? ((rate.length - 1) / (now - rate[0]) * 1000).toFixed(1) : '';
      }
      dirty = false;
    };
    requestAnimationFrame(step);
    return () => { ended = true; };
  }, [clip.id]);

  const split = mode === 'split' && clip.picture;
  const drag = (event) => {
    if (!split || (event.type === 'pointermove' && !event.buttons)) return;
    const bounds = canvas.current.getBoundingClientRect();
    if (event.type === 'pointerdown') event.currentTarget.setPointerCapture(event.pointerId);
    setDivider(Math.min(1, Math.max(0, (event.clientX - bounds.left) / bounds.width)));
  };
  const onKey = (event) => {
    const by = {ArrowLeft: -0.05, ArrowRight: 0.05}[event.key];
    if (!by) return;
    event.stopPropagation();
    event.preventDefault();
    setDivider(Math.min(1, Math.max(0, divider + by)));
  };
  const aspect = clip.info ? clip.info.shown_width / clip.info.height : 16 / 9;
  const wide = mode === 'side' && clip.picture ? 2 * aspect : aspect;
  return html`
    <div class="stage" ref=${box}>
      <div class="picture" style=${{aspectRatio: String(wide), '--aspect': String(wide)}}
           onPointerDown=${drag} onPointerMove=${drag}>
        <canvas ref=${canvas} width="16" height="9" role="img" aria-label=${`${T.modes[mode]}: ${clip.name}`}></canvas>
        ${split && html`
          <div class="divider" role="slider" tabindex="0" aria-label=${T.divider} aria-valuemin="0" aria-valuemax="100"
               aria-valuenow=${Math.round(divider * 100)} style=${{left: `${divider * 100}%`}} onKeyDown=${onKey}><span></span></div>
          <span class="tag left">${T.before}</span><span class="tag right">${T.after}</span>`}
        ${mode === 'side' && clip.picture && html`<span class="tag left">${T.before}</span><span class="tag right">${T.after}</span>`}
        ${mode === 'tracks' && clip.picture && html`<${Lasso} clip=${clip} frame=${frame} playing=${transport.speed !== 0} />`}
        ${clip.stale && html`<span class="tag busy" role="status">${T.updating}</span>`}
      </div>
    </div>`;
}
