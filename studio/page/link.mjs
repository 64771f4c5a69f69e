// What the page hears from the studio, and what it asks for.
import {useEffect, useState} from './lib/htm-preact.mjs';

const state = {clips: {}, order: [], renders: [], roots: [], trouble: '', connected: true, loaded: false};
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
    for (const key of ['order', 'renders', 'roots', 'trouble']) {
      if (key in data) state[key] = data[key];
    }
    state.loaded = true;
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

export function frameAddress(clip, side, frame, width) {
  return '/api/frame?' + new URLSearchParams(
    {clip: clip.id, side, frame, width, v: side === 'before' ? 0 : clip.picture || 0});
}

// A document of a clip that has a number of its own, such as its panel.
export function useDocument(path, clip, version) {
  const [held, hold] = useState({});
  useEffect(() => {
    if (!clip || !version) return undefined;
    let wanted = true;
    get(path, {clip}).then((document) => wanted && !document.error && hold({clip, document}));
    return () => { wanted = false; };
  }, [path, clip, version]);
  return held.clip === clip ? held.document : undefined;
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
