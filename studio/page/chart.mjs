// The camera's path before and after, and what the window does, over time.
import uPlot from './lib/uPlot.mjs';
import {html, useEffect, useLayoutEffect, useMemo, useRef, useState} from './lib/htm-preact.mjs';
import {useDocument} from './link.mjs';
import {T} from './texts.mjs';

const KINDS = ['x', 'y', 'angle', 'zoom', 'window', 'black'];

function columns(kind, shots, info) {
  const rows = info.interlaced ? 2 : 1;
  const seconds = [], before = [], after = [];
  let end = 0;
  for (const shot of shots) {
    const curves = shot.curves;
    if (!curves || shot.first < end) continue;  // what is drawn goes from left to right
    end = shot.end;
    const list = kind === 'window' ? curves.zooms : kind === 'black' ? curves.black.map((share) => share === null ? null : share * 100) : curves.after[kind];
    list.slice(0, (end - shot.first) * rows).forEach((value, i) => {
      seconds.push((shot.first + i / rows) / info.rate);
      before.push(kind in curves.before ? curves.before[kind][i] ?? null : null);
      after.push(value);
    });
    // A gap, so that nothing is drawn from a shot to the next.
    seconds.push((shot.end - 0.25) / info.rate);
    before.push(null);
    after.push(null);
  }
  return kind === 'window' || kind === 'black' ? [seconds, after] : [seconds, before, after];
}

function colour(name) {
  return getComputedStyle(document.documentElement).getPropertyValue(name).trim();
}

export function Chart({clip, frame, seek, theme}) {
  const [kind, setKind] = useState('x');
  const box = useRef(), live = useRef({});
  const document_ = useDocument('/api/curves', clip.id, clip.curves);
  const shots = document_?.shots?.filter((shot) => shot.curves);
  Object.assign(live.current, {frame, clip, seek});
  const data = useMemo(() => shots?.length && clip.info ? columns(kind, shots, clip.info) : null, [document_, kind, clip.info?.rate]);

  useEffect(() => {
    if (!data) return undefined;
    const two = data.length === 3;
    const axis = {stroke: colour('--dim'), grid: {stroke: colour('--line'), width: 1}, ticks: {stroke: colour('--line'), width: 1},
                  font: '11px system-ui, sans-serif'};
    const mark = (plot, seconds, style, dash) => {
      const x = plot.valToPos(seconds, 'x', true);
      const {left, top, width, height} = plot.bbox;
      if (x < left || x > left + width) return;
      plot.ctx.save();
      plot.ctx.strokeStyle = style;
      plot.ctx.lineWidth = devicePixelRatio;
      plot.ctx.setLineDash(dash);
      plot.ctx.beginPath();
      plot.ctx.moveTo(x, top);
      plot.ctx.lineTo(x, top + height);
      plot.ctx.stroke();
      plot.ctx.restore();
    };
    // Moved by itself: while a clip plays nothing else of the chart is drawn anew.
    const head = document.createElement('i');
    head.className = 'now';
    const place = (of) => {
      const {clip: shown, frame: at} = live.current;
      const x = shown.info ? of.valToPos(at / shown.info.rate, 'x') : -1;
      head.hidden = !(x >= 0 && x <= of.bbox.width / devicePixelRatio);
      head.style.transform = `translateX(${x}px)`;
    };
    live.current.place = () => place(plot);
    const options = {
      width: Math.max(200, box.current.clientWidth), height: 150,
      legend: {show: false},
      cursor: {drag: {x: true, y: false}, points: {show: false}},
      scales: {x: {time: false}},
      axes: [{...axis, size: 28, values: (_, list) => list.map((s) => `${+s.toFixed(2)} s`)}, {...axis, size: 48}],
      series: two
        ? [{}, {stroke: colour('--before'), width: 1.25, points: {show: false}, label: T.seriesBefore}, {stroke: colour('--accent'), width: 2, points: {show: false}, label: T.seriesAfter}]
        : [{}, {stroke: colour('--accent'), width: 2, points: {show: false}, label: kind === 'window' ? T.seriesZoom : T.seriesBlack, ...(kind === 'black' ? {fill: colour('--accent-soft')} : {})}],
      hooks: {
        draw: [(plot) => {
          const {clip: of} = live.current;
          if (!of.info) return;
          for (const shot of (of.shots || []).slice(1)) mark(plot, shot.first / of.info.rate, colour('--dim'), [2, 4]);
          const worst = of.outcome?.worst_shake > 0 ? of.outcome.worst_at : undefined;
          if (worst !== undefined) mark(plot, worst, colour('--warn'), [6, 4]);
          place(plot);
        }],
      },
    };
    const plot = new uPlot(options, data, box.current);
    plot.over.append(head);
    place(plot);
    plot.over.addEventListener('click', (event) => {
      if (plot.select.width > 2) return;
      const {clip: of} = live.current;
      live.current.seek(Math.round(plot.posToVal(event.offsetX, 'x') * of.info.rate));
    });
    const watch = new ResizeObserver(() => {
      const width = Math.max(200, box.current?.clientWidth || 0);
      if (width !== plot.width) plot.setSize({width, height: 150});
    });
    watch.observe(box.current);
    return () => { watch.disconnect(); plot.destroy(); live.current.place = null; };
  }, [data, theme]);

  useLayoutEffect(() => live.current.place?.(), [frame]);

  return html`
    <section class="chart" aria-label=${T.motion}>
      <div class="tabs" role="tablist">
        ${KINDS.map((one) => html`<button role="tab" aria-selected=${one === kind} onClick=${() => setKind(one)}>${T.curves[one]}</button>`)}
        <span class="keys">${data && kind !== 'window' && kind !== 'black' ? html`<i class="before"></i>${T.seriesBefore} <i class="after"></i>${T.seriesAfter}` : ''}
          ${data && clip.outcome?.worst_shake > 0 ? html` <i class="worst"></i>${T.worst}` : ''}</span>
      </div>
      ${data ? html`<div class="plot" ref=${box} role="img" aria-label=${T.curvesMean[kind]} title=${T.curvesMean[kind]}></div>`
             : html`<p class="hint">${T.noCurves}</p>`}
    </section>`;
}
