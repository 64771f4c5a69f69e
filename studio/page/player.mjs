// The picture: before and after, playing or still.
import {html, useEffect, useLayoutEffect, useRef, useState} from './lib/htm-preact.mjs';
import {Lasso} from './lasso.mjs';
import {framesAddress} from './link.mjs';
import {T} from './texts.mjs';

const AHEAD = 10;       // frames that are fetched ahead of the play head
const AT_ONCE = 4;      // requests
const KEPT = 5e7;       // pixels of decoded pictures, four bytes each
const WIDEST_PLAYING = 960;
const WIDEST_STILL = 1920;
const ROUGH = 640;      // width of a picture that is better than none
const PATIENCE = 60;    // milliseconds that a picture may take before a rough one goes ahead of it
const FARTHEST_BACK = 240;  // frames that a picture may be late
const REST = 250;       // milliseconds without a change, after which nobody is in a hurry

export const SIDES = {split: 'both', side: 'both', difference: 'both', before: 'before', after: 'after', tracks: 'tracks'};

// Pictures by their address, fetched in the order of their need.
class Pictures {
  constructor(arrived) {
    this.arrived = arrived;
    this.held = new Map();
    this.running = new Map();
    this.refused = new Map();
    this.pixels = 0;
    this.timed = Infinity;  // a width
    this.pace = 0;  // milliseconds that the last one took that is so wide
    this.again = 0;
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
    clearTimeout(this.again);
    for (const address of addresses) {
      if (this.running.size >= AT_ONCE) return;
      if (this.held.has(address) || this.running.has(address)) continue;
      const wait = (this.refused.get(address) || 0) - now;
      if (wait > 0) this.again = setTimeout(this.arrived, wait);
      else this.fetch(address);
    }
  }

  stop() {
    clearTimeout(this.again);
    this.arrived = () => {};
    for (const abort of this.running.values()) abort.abort();
  }

  async fetch(address) {
    const abort = new AbortController();
    const begin = performance.now();
    this.running.set(address, abort);
    try {
      const response = await fetch(address, {signal: abort.signal});
      if (!response.ok) {
        // Busy: later; gone: much later.
        this.refused.set(address, performance.now() + (response.status === 503 ? 150 : 5000));
        await response.arrayBuffer();
      } else {
        const picture = await createImageBitmap(await response.blob());
        if (picture.width >= this.timed) this.pace = performance.now() - begin;
        this.held.set(address, picture);
        this.refused.delete(address);
        this.pixels += picture.width * picture.height;
        while (this.pixels > KEPT && this.held.size > 4) {
          const [oldest, dropped] = this.held.entries().next().value;
          this.held.delete(oldest);
          this.pixels -= dropped.width * dropped.height;
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

// A width at which a frame is drawn from one of its pixels in a whole number, and little work.
function roughWidth(info, widest) {
  return Math.floor(info.shown_width / Math.max(2, Math.ceil(info.shown_width / widest)));
}

// Draws one picture; `both`: it has before above after, or `before` is a picture of its own, of any size.
function paint(canvas, picture, before, mode, both, divider) {
  const width = picture.width, height = both && !before ? picture.height / 2 : picture.height;
  const context = canvas.getContext('2d', {alpha: false});
  if (!both) {
    fit(canvas, width, height);
    context.drawImage(picture, 0, 0);
    return;
  }
  const first = before || picture;
  const from = [0, 0, first.width, before ? first.height : height];
  const after = [0, before ? 0 : height, width, height];
  if (mode === 'side') {
    fit(canvas, 2 * width + 4, height);
    context.fillStyle = '#000';
    context.fillRect(0, 0, canvas.width, height);
    context.drawImage(first, ...from, 0, 0, width, height);
    context.drawImage(picture, ...after, width + 4, 0, width, height);
    return;
  }
  fit(canvas, width, height);
  context.globalCompositeOperation = 'source-over';
  if (mode === 'difference') {
    context.drawImage(first, ...from, 0, 0, width, height);
    context.globalCompositeOperation = 'difference';
    context.drawImage(picture, ...after, 0, 0, width, height);
    context.globalCompositeOperation = 'source-over';
    return;
  }
  const left = Math.round(width * divider);
  context.drawImage(picture, ...after, 0, 0, width, height);
  if (left > 0) context.drawImage(first, 0, 0, from[2] * left / width, from[3], 0, 0, left, height);
}

// transport: {frame, speed, range: [in, out], loop}, shared with the page; onFrame(frame): it moved.
export function Player({clip, mode, frame, transport, onFrame, onStop}) {
  const box = useRef(), canvas = useRef();
  const live = useRef({});
  const [divider, setDivider] = useState(0.5);
  Object.assign(live.current, {clip, mode, transport, onFrame, onStop, divider});

  useEffect(() => {
    const engine = live.current;
    let ended = false, timer = 0, across = box.current.clientWidth;
    let shown = null, started = null, lastSpeed = 0, rate = [], drawn = '';
    // While it plays: pictures that don't come in time are made smaller, then every so many frames are left out.
    let narrow = false, stride = 1, slot = -1, seen = 0, hits = 0, since = 0;
    let asked = '', restAt = 0;  // of what is changed by hand
    engine.pictures = new Pictures(() => engine.work());

    const advance = (now, of, how) => {
      const frames = of.info.frames;
      // By the clock, so that what comes late is left out.
      if (how.speed !== lastSpeed || (how.speed && started?.seek !== how.seek)) {
        started = {now, frame: how.frame, seek: how.seek};
        lastSpeed = how.speed;
        rate = [];
        narrow = false;
        stride = 1;
        seen = hits = 0;
        since = now + 300;  // what is at the start has no time to be there
      }
      if (!how.speed) return;
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
      if (frame === how.frame) return;
      how.frame = frame;
      engine.onFrame(frame);
    };

    // What is wanted of a play head that moves, and the nearest of it that is there.
    const playing = (now, of, how, address, width) => {
      const held = engine.pictures.held;
      const sign = Math.sign(how.speed), by = stride * Math.max(1, Math.abs(how.speed));
      const less = Math.min(width, roughWidth(of.info, ROUGH));
      const wide = narrow ? less : Math.min(width, WIDEST_PLAYING);
      const present = Math.floor(how.frame / by) * by;
      if (present !== slot) {
        slot = present;
        if (now > since) {
          ++seen;
          if (held.has(address(slot, wide))) ++hits;
        }
      }
      if (now > since + 1000) {
        const due = (now - since) / 1000 * of.info.rate * Math.abs(how.speed) / by;
        // Late pictures, or a screen that has no time to show as many.
        if (hits < 0.8 * seen || seen < 0.6 * due) {
          if (!narrow && less >= ROUGH / 2 && less < wide) narrow = true;
          else if (stride < 8) ++stride;
        } else if (hits > 0.95 * due && stride > 1) {
          --stride;
        }
        seen = hits = 0;
        since = now;
      }
      const list = [];
      const first = Math.ceil(how.frame / by) * by;
      for (let i = 0; i < AHEAD; ++i) {
        const frame = first + sign * i * by;
        if (frame >= 0 && frame < of.info.frames) list.push(address(frame, wide));
      }
      let onView = address(how.frame, wide);
      for (let back = 0; back <= Math.min(2 * of.info.rate, FARTHEST_BACK); ++back) {
        const near = [wide, less].map((one) => address(how.frame - sign * back, one)).find((one) => held.has(one));
        if (near) {
          onView = near;
          break;
        }
      }
      return [list, onView];
    };

    engine.work = () => {
      const {clip: of, transport: how} = engine;
      if (ended || !of?.info || document.hidden) return;
      const now = performance.now();
      advance(now, of, how);
      const ready = of.state === 'ready' || (of.picture && of.shots?.length);
      const wanted = ready ? engine.mode : 'before';
      const side = SIDES[wanted];
      const room = Math.max(160, across / (wanted === 'side' ? 2 : 1) * devicePixelRatio);
      // In steps, so that a window's size by itself makes no new pictures.
      const width = Math.min(of.info.shown_width, WIDEST_STILL, Math.ceil(room / 160) * 160);
      // Apart where it stands still: of a change the steady one alone is fetched.
      const apart = !how.speed && side === 'both';
      engine.pictures.timed = how.speed ? Infinity : width;
      const common = framesAddress(of, apart ? 'after' : side), beside = framesAddress(of, 'before');
      const address = (frame, wide) => `${common}&width=${wide}&frame=${frame}`;
      let list = [], onView = address(how.frame, width), other = '';
      if (how.speed) {
        [list, onView] = playing(now, of, how, address, width);
      } else {
        const besideAt = (wide) => `${beside}&width=${wide}&frame=${how.frame}`;
        const held = engine.pictures.held;
        if (asked !== onView) {
          restAt = asked ? now + REST : now;
          asked = onView;
        }
        const rough = Math.min(width, roughWidth(of.info, WIDEST_PLAYING));
        const hurries = now < restAt && rough >= ROUGH && rough < width && engine.pictures.pace > PATIENCE;
        clearTimeout(timer);
        if (hurries) timer = setTimeout(engine.work, restAt - now);
        const pick = (at) => (held.has(at(width)) || (!hurries && !held.has(at(rough))) ? at(width) : at(rough));
        onView = pick((wide) => address(how.frame, wide));
        if (apart) other = pick(besideAt);
        const best = hurries ? [onView, other] : [address(how.frame, width), apart ? besideAt(width) : ''];
        list = best.filter(Boolean);
      }
      engine.pictures.want(list, how.speed !== 0);
      canvas.current.dataset.wanted = how.speed ? '' : address(how.frame, width);
      const picture = engine.pictures.get(onView);
      const before = other && engine.pictures.get(other);
      const key = `${onView} ${other} ${wanted} ${engine.divider}`;
      if (picture && (!other || before) && key !== drawn) {
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
      if (how.speed && !engine.loops) {
        engine.loops = true;
        requestAnimationFrame(() => { engine.loops = false; engine.work(); });
      }
    };
    // Asked for in each frame it would have the page laid out for each.
    const watch = new ResizeObserver(() => {
      across = box.current?.clientWidth || across;
      engine.work();
    });
    watch.observe(box.current);
    document.addEventListener('visibilitychange', engine.work);
    engine.work();
    return () => {
      ended = true;
      clearTimeout(timer);
      engine.pictures.stop();
      watch.disconnect();
      document.removeEventListener('visibilitychange', engine.work);
    };
  }, [clip.id]);
  // Whatever has changed is fetched at once, not with the next frame of the screen.
  useLayoutEffect(() => { if (!live.current.loops) live.current.work?.(); });

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
