// What the page hears from the studio, and what it asks for.
import {useEffect, useState} from './lib/htm-preact.mjs';

const state = {clips: {}, order: [], renders: [], roots: [], sample: null, trouble: '', heard: 0, connected: true, loaded: false};
const listeners = new Set();

function tell() {
  for (const listener of listeners) listener();
}

function connect() {
  const source = new EventSource('/api/events');
  source.onopen = () => {
    // What comes first is all there is.
    state.clips = {};
    state.connected = true;
    tell();
  };
  source.onmessage = (event) => {
    const data = JSON.parse(event.data);
    Object.assign(state.clips, data.clips);
    for (const key of ['order', 'renders', 'roots', 'sample', 'trouble']) {
      if (key in data) state[key] = data[key];
    }
    state.loaded = true;
    ++state.heard;
    state.connected = true;
    tell();
  };
  source.onerror = () => {
    state.connected = false;
    tell();
    if (source.readyState === EventSource.CLOSED) setTimeout(connect, 1500);
  };
}
connect();

export function useStudio() {
  const [, count] = useState(0);
  useEffect(() => {
    const listener = () => count((n) => n + 1);
    listeners.add(listener);
    listener();  // of what was told before
    return () => listeners.delete(listener);
  }, []);
  return state;
}

export async function ask(request) {
  try {
    const response = await fetch('/api/do', {
      method: 'POST',
      headers: {'Content-Type': 'application/json'},
      body: JSON.stringify(request),
    });
    return await response.json();
  } catch (error) {
    return {error: String(error)};
  }
}

export async function get(path, parameters) {
  try {
    const response = await fetch(`${path}?${new URLSearchParams(parameters)}`);
    return await response.json();
  } catch (error) {
    return {error: String(error)};
  }
}

// Where what is made of a clip is offered to be written: beside it, unless it lies where no folder is open.
export function folderOf(clip, roots) {
  const folder = clip.path.replace(/\/[^/]*$/, '') || '/';
  const isOpen = roots.some((root) => folder === root || folder.startsWith(root === '/' ? root : `${root}/`));
  return isOpen ? folder : roots[0];
}

export function stemOf(clip) {
  return clip.name.replace(/\.[^.]*$/, '');
}

// Of a clip's pictures, but for their width and their frame.
export function framesAddress(clip, side) {
  return `/api/frame?clip=${clip.id}&side=${side}&v=${side === 'before' ? 0 : clip.picture || 0}`;
}

export function frameAddress(clip, side, frame, width) {
  return `${framesAddress(clip, side)}&width=${width}&frame=${frame}`;
}

// A document of a clip that has a number of its own, such as its panel.
export function useDocument(path, clip, version) {
  const [held, hold] = useState({});
  useEffect(() => {
    if (!clip || !version) return undefined;
    let wanted = true, again = 0;
    const fetchIt = async () => {
      const document = await get(path, {clip});
      if (!wanted) return;
      if (!document.error) hold({clip, document});
      else if (document.why === 'busy') again = setTimeout(fetchIt, 2000);
    };
    fetchIt();
    return () => { wanted = false; clearTimeout(again); };
  }, [path, clip, version]);
  return held.clip === clip ? held.document : undefined;
}

// Figures as far as they could be measured.
export function fixed(figure, digits) {
  return Number.isFinite(figure) ? figure.toFixed(digits) : '–';
}

export function percent(share, digits = 0) {
  return fixed(Number.isFinite(share) ? share * 100 : NaN, digits);
}

export function timeText(seconds) {
  const whole = Math.max(0, seconds);
  const minutes = Math.floor(whole / 60);
  return `${minutes}:${(whole - minutes * 60).toFixed(2).padStart(5, '0')}`;
}

export function leftText(seconds) {
  const whole = Math.ceil(seconds);
  return `${Math.floor(whole / 60)}:${String(whole % 60).padStart(2, '0')}`;
}
