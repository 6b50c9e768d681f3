// The report page: decodes the per-frame columns embedded in the page and
// draws them on canvases. Long recordings stay fast because each pixel
// column of the plot draws a summary of the frames under it, never one
// element per frame.
(function () {
  'use strict';

  const PAD_LETTERS = 'ABCDEFGHIJKLMNO';
  const PAD_COUNT = 15;
  const REGION_NAMES = ['none', 'middle', 'bottom', 'top'];
  const REGION_COLOURS = ['#9aa3ab', '#2e8540', '#1f5fbf', '#c8322b'];
  const PHASE_WORDS = ['', 'STARTTOUCH', 'HOLDING', 'STARTHOLD', 'SUPPRESSHOLD', 'TOUCHING',
    'ENDHOLD', 'TAP', 'SUPPRESSTAP', 'ENDTOUCH'];
  // Phases printed with the noise word: the release frames.
  const FIRST_RELEASE_PHASE = 6;
  const FLAG_ABOVE_NOISE = 2;

  const MARGIN_LEFT = 64;
  const MARGIN_RIGHT = 12;
  const LANE_GAP = 8;
  const LANES = [
    { id: 'heat', label: 'pads', height: 15 * 11 },
    { id: 'svm', label: 'SVM score', height: 64, column: 'svm' },
    { id: 'touch', label: 'touch score', height: 64, column: 'touch' },
    // The tap score runs into the millions for touches shorter than a frame;
    // a logarithmic scale keeps the sign change at 0 visible.
    { id: 'tap', label: 'tap score (log scale)', height: 64, column: 'tap', log: true },
    { id: 'region', label: 'region', height: 16 },
    { id: 'events', label: 'events', height: 58 },
    { id: 'axis', label: '', height: 22 },
  ];

  const data = JSON.parse(document.getElementById('data').textContent);
  const frameCount = data.frameCount;

  // ---- decoding -------------------------------------------------------------

  function bytesOf(base64) {
    const text = atob(base64);
    const bytes = new Uint8Array(text.length);
    for (let i = 0; i < text.length; i++) bytes[i] = text.charCodeAt(i);
    return bytes;
  }

  // Zigzag LEB128 differences, summed back into values. Arithmetic instead of
  // bit operations keeps values beyond 32 bits.
  function decodeDeltaVarint(bytes, count, out) {
    let at = 0;
    let value = 0;
    for (let i = 0; i < count; i++) {
      let zigzag = 0;
      let scale = 1;
      let byte;
      do {
        byte = bytes[at++];
        zigzag += (byte & 0x7f) * scale;
        scale *= 128;
      } while (byte & 0x80);
      value += zigzag % 2 === 0 ? zigzag / 2 : -(zigzag + 1) / 2;
      out[i] = value;
    }
    return out;
  }

  function decodeColumn(name, ArrayType) {
    const column = data.columns[name];
    const bytes = bytesOf(column.data);
    if (column.kind === 'float32') {
      const view = new DataView(bytes.buffer);
      const out = new Float32Array(frameCount);
      for (let i = 0; i < frameCount; i++) out[i] = view.getFloat32(i * 4, true);
      return out;
    }
    return decodeDeltaVarint(bytes, frameCount, new (ArrayType || Int32Array)(frameCount));
  }

  const col = {};
  col.t = decodeColumn('t', Float64Array);
  for (const name of ['frame', 'timeMs', 'phaseMs']) col[name] = decodeColumn(name, Float64Array);
  for (const name of ['active', 'flags', 'region', 'phase', 'nonActive']) col[name] = decodeColumn(name);
  for (const name of ['svm', 'touch', 'tap', 'signalPerDuration', 'signalPerTouchDuration', 'timeDurationRatio']) {
    col[name] = decodeColumn(name);
  }
  const readings = [];
  const levels = [];
  for (let pad = 0; pad < PAD_COUNT; pad++) {
    readings.push(decodeColumn('r' + pad));
    levels.push(decodeColumn('l' + pad));
  }

  const events = data.events;
  const states = data.states;
  const gaps = data.gaps;
  const resets = events.filter((event) => event.gesture === 'device-reset');
  const gestures = events.filter((event) => event.gesture !== 'device-reset');
  const eventsByFrame = new Map();
  for (const event of events) {
    if (!eventsByFrame.has(event.i)) eventsByFrame.set(event.i, []);
    eventsByFrame.get(event.i).push(event);
  }

  // A frame covers the time up to the next one, but not across a pause:
  // a pause longer than a few frame periods shows as empty.
  let period = 10000;
  if (frameCount > 1) {
    const steps = [];
    const stride = Math.max(1, Math.floor(frameCount / 2000));
    for (let i = 1; i < frameCount; i += stride) steps.push(col.t[i] - col.t[i - 1]);
    steps.sort((a, b) => a - b);
    period = Math.max(1, steps[Math.floor(steps.length / 2)]);
  }
  const fullStart = frameCount ? col.t[0] : 0;
  const fullEnd = frameCount ? col.t[frameCount - 1] + period : 1000000;
  const minSpan = Math.max(period * 8, 1000);

  const identity = (v) => v;
  const symlog = (v) => Math.sign(v) * Math.log10(1 + Math.abs(v));
  const unsymlog = (v) => Math.sign(v) * (Math.pow(10, Math.abs(v)) - 1);

  function extent(values, transform) {
    let low = 0;
    let high = 0;
    for (let i = 0; i < values.length; i++) {
      const v = transform(values[i]);
      if (!Number.isFinite(v)) continue;
      if (v < low) low = v;
      if (v > high) high = v;
    }
    if (high === low) high = low + 1;
    return [low, high];
  }
  const ranges = { svm: extent(col.svm, identity), touch: extent(col.touch, identity), tap: extent(col.tap, symlog) };

  function heatScale(columns) {
    let high = 1;
    for (const values of columns) {
      for (let i = 0; i < values.length; i++) if (values[i] > high) high = values[i];
    }
    return high;
  }
  const heatHigh = { readings: heatScale(readings), levels: heatScale(levels) };

  // ---- state ----------------------------------------------------------------

  const view = { start: fullStart, end: fullEnd };
  let cursor = -1;
  let showLevels = false;
  let drawPending = false;
  let markerHits = [];

  const chart = document.getElementById('chart');
  const overview = document.getElementById('overview');
  const info = document.getElementById('frame-info');

  function laneTop(id) {
    let y = 0;
    for (const lane of LANES) {
      if (lane.id === id) return y;
      y += lane.height + LANE_GAP;
    }
    return y;
  }
  const chartHeight = laneTop('none') - LANE_GAP;

  function plotWidth() { return Math.max(10, chart.clientWidth - MARGIN_LEFT - MARGIN_RIGHT); }
  function xOf(t) { return MARGIN_LEFT + (t - view.start) / (view.end - view.start) * plotWidth(); }
  function tOf(x) { return view.start + (x - MARGIN_LEFT) / plotWidth() * (view.end - view.start); }

  // First frame at or after time t.
  function lowerBound(t) {
    let low = 0;
    let high = frameCount;
    while (low < high) {
      const mid = (low + high) >> 1;
      if (col.t[mid] < t) low = mid + 1; else high = mid;
    }
    return low;
  }

  function nearestFrame(t) {
    if (!frameCount) return -1;
    const after = Math.min(lowerBound(t), frameCount - 1);
    const before = Math.max(after - 1, 0);
    return Math.abs(col.t[before] - t) <= Math.abs(col.t[after] - t) ? before : after;
  }

  // For each pixel column of the plot, the frames under it: [first, end).
  // A column with no frame of its own shows the frame that still covers it.
  function columnSpans(columns) {
    const first = new Int32Array(columns);
    const end = new Int32Array(columns);
    const span = (view.end - view.start) / columns;
    let i = lowerBound(view.start);
    for (let c = 0; c < columns; c++) {
      const c1 = view.start + (c + 1) * span;
      const start = i;
      while (i < frameCount && col.t[i] < c1) i++;
      if (i > start) {
        first[c] = start;
        end[c] = i;
      } else if (start > 0 && col.t[start - 1] + period * 1.5 > view.start + c * span) {
        first[c] = start - 1;
        end[c] = start;
      } else {
        first[c] = -1;
        end[c] = -1;
      }
    }
    return { first, end };
  }

  // ---- drawing ----------------------------------------------------------------

  function sizeCanvas(canvas, height) {
    const ratio = window.devicePixelRatio || 1;
    const width = canvas.clientWidth;
    if (canvas.style.height !== height + 'px') canvas.style.height = height + 'px';
    if (canvas.width !== Math.round(width * ratio) || canvas.height !== Math.round(height * ratio)) {
      canvas.width = Math.round(width * ratio);
      canvas.height = Math.round(height * ratio);
    }
    const context = canvas.getContext('2d');
    context.setTransform(ratio, 0, 0, ratio, 0, 0);
    return context;
  }

  // Dark blue through teal and yellow to white, on a square-root scale so
  // that small readings still show.
  const HEAT_STOPS = [[12, 20, 48], [24, 92, 140], [38, 168, 140], [240, 220, 60], [255, 255, 255]];
  function heatColour(value, high, out, at) {
    let f = value <= 0 ? 0 : Math.sqrt(Math.min(value / high, 1));
    f *= HEAT_STOPS.length - 1;
    const k = Math.min(Math.floor(f), HEAT_STOPS.length - 2);
    const w = f - k;
    const a = HEAT_STOPS[k];
    const b = HEAT_STOPS[k + 1];
    out[at] = a[0] + (b[0] - a[0]) * w;
    out[at + 1] = a[1] + (b[1] - a[1]) * w;
    out[at + 2] = a[2] + (b[2] - a[2]) * w;
    out[at + 3] = 255;
  }

  const heatBitmap = document.createElement('canvas');
  heatBitmap.height = PAD_COUNT;

  function drawHeat(context, spans, columns, top, height) {
    const source = showLevels ? levels : readings;
    const high = showLevels ? heatHigh.levels : heatHigh.readings;
    const image = new ImageData(columns, PAD_COUNT);
    const pixels = image.data;
    for (let c = 0; c < columns; c++) {
      const a = spans.first[c];
      const b = spans.end[c];
      for (let pad = 0; pad < PAD_COUNT; pad++) {
        const at = (pad * columns + c) * 4;
        if (a < 0) { pixels[at + 3] = 0; continue; }
        const values = source[pad];
        let peak = values[a];
        for (let i = a + 1; i < b; i++) if (values[i] > peak) peak = values[i];
        heatColour(peak, high, pixels, at);
      }
    }
    if (heatBitmap.width !== columns) heatBitmap.width = columns;
    heatBitmap.getContext('2d').putImageData(image, 0, 0);
    const bitmap = heatBitmap;
    context.imageSmoothingEnabled = false;
    context.drawImage(bitmap, MARGIN_LEFT, top, plotWidth(), height);
    context.fillStyle = '#1d232a';
    context.font = '10px ui-monospace, monospace';
    context.textAlign = 'right';
    context.textBaseline = 'middle';
    const row = height / PAD_COUNT;
    for (let pad = 0; pad < PAD_COUNT; pad++) context.fillText(PAD_LETTERS[pad], MARGIN_LEFT - 6, top + (pad + 0.5) * row);
  }

  function drawLine(context, spans, columns, values, range, log, top, height) {
    const [low, high] = range;
    const transform = log ? symlog : identity;
    const y = (v) => top + height - (Math.min(Math.max(transform(v), low), high) - low) / (high - low) * height;
    const step = plotWidth() / columns;
    context.strokeStyle = '#d5dbe1';
    context.lineWidth = 1;
    context.beginPath();
    context.moveTo(MARGIN_LEFT, Math.round(y(0)) + 0.5);
    context.lineTo(MARGIN_LEFT + plotWidth(), Math.round(y(0)) + 0.5);
    context.stroke();
    context.strokeStyle = '#37474f';
    context.beginPath();
    let open = false;
    for (let c = 0; c < columns; c++) {
      const a = spans.first[c];
      if (a < 0) { open = false; continue; }
      let min = Infinity;
      let max = -Infinity;
      for (let i = a; i < spans.end[c]; i++) {
        const v = values[i];
        if (!Number.isFinite(v)) continue;
        if (v < min) min = v;
        if (v > max) max = v;
      }
      if (min === Infinity) { open = false; continue; }
      const x = MARGIN_LEFT + (c + 0.5) * step;
      if (open) context.lineTo(x, y(values[a])); else context.moveTo(x, y(values[a]));
      context.lineTo(x, y(min));
      context.lineTo(x, y(max));
      context.lineTo(x, y(values[spans.end[c] - 1]));
      open = true;
    }
    context.stroke();
    context.fillStyle = '#66707a';
    context.font = '10px system-ui, sans-serif';
    context.textAlign = 'right';
    context.textBaseline = 'top';
    const label = log ? unsymlog : identity;
    context.fillText(formatNumber(label(high)), MARGIN_LEFT - 6, top);
    context.textBaseline = 'bottom';
    context.fillText(formatNumber(label(low)), MARGIN_LEFT - 6, top + height);
  }

  function drawRegion(context, spans, columns, top, height) {
    const step = plotWidth() / columns;
    const counts = [0, 0, 0, 0];
    // Runs of one region, one path per region.
    const runs = [[], [], [], []];
    let runRegion = -1;
    let runStart = 0;
    const closeRun = (c) => { if (runRegion >= 0) runs[runRegion].push(runStart, c); };
    for (let c = 0; c < columns; c++) {
      const a = spans.first[c];
      let region = -1;
      if (a >= 0) {
        counts.fill(0);
        for (let i = a; i < spans.end[c]; i++) counts[col.region[i]]++;
        // The region most of the column's frames are in; none only when all are.
        region = 0;
        for (let r = 1; r < 4; r++) if (counts[r] > (region ? counts[region] : 0)) region = r;
      }
      if (region !== runRegion) {
        closeRun(c);
        runRegion = region;
        runStart = c;
      }
    }
    closeRun(columns);
    for (let region = 0; region < 4; region++) {
      context.beginPath();
      for (let k = 0; k < runs[region].length; k += 2) {
        context.rect(MARGIN_LEFT + runs[region][k] * step, top, (runs[region][k + 1] - runs[region][k]) * step, height);
      }
      context.fillStyle = region === 0 ? '#eef1f4' : REGION_COLOURS[region];
      context.fill();
    }
  }

  // Adds one marker to the current path: the shape tells the gesture.
  function addMarker(context, gesture, x, y, size) {
    switch (gesture) {
      case 'may-begin':
      case 'tap':
        context.moveTo(x + size, y);
        context.arc(x, y, size, 0, Math.PI * 2);
        break;
      case 'hold-start':
        context.moveTo(x - size, y - size);
        context.lineTo(x + size, y);
        context.lineTo(x - size, y + size);
        context.closePath();
        break;
      case 'hold-change':
        context.moveTo(x, y - size);
        context.lineTo(x + size, y);
        context.lineTo(x, y + size);
        context.lineTo(x - size, y);
        context.closePath();
        break;
      case 'hold-end':
        context.rect(x - size, y - size, size * 2, size * 2);
        break;
      default:
        context.moveTo(x - size, y - size);
        context.lineTo(x + size, y + size);
        context.moveTo(x + size, y - size);
        context.lineTo(x - size, y + size);
    }
  }

  // Markers that look alike are drawn as one path: zoomed out there are
  // thousands of them.
  function drawEvents(context, top, height) {
    const left = MARGIN_LEFT;
    const right = MARGIN_LEFT + plotWidth();
    const visible = (x) => x >= left - 8 && x <= right + 8;
    markerHits = [];
    // Many marks can fall on one pixel: each pixel column takes a kind of mark once.
    const drawn = new Set();
    const firstAt = (x, kind) => {
      const key = Math.round(x) + kind;
      if (drawn.has(key)) return false;
      drawn.add(key);
      return true;
    };
    const lineAcross = (marks, kind, colour) => {
      context.beginPath();
      for (const mark of marks) {
        const x = Math.round(xOf(mark.t)) + 0.5;
        if (!visible(x) || !firstAt(x, kind)) continue;
        context.moveTo(x, 0);
        context.lineTo(x, top + height);
      }
      context.strokeStyle = colour;
      context.stroke();
    };
    // Gaps and resets cross every lane.
    context.save();
    context.setLineDash([3, 3]);
    context.lineWidth = 1;
    lineAcross(gaps, 'gap', '#e08a00');
    lineAcross(resets, 'reset', '#8e24aa');
    context.restore();

    const gestureRow = top + 14;
    const stateRow = top + 36;
    const styles = new Map();
    for (const event of gestures) {
      const x = xOf(event.t);
      const style = event.gesture + ' ' + event.region;
      if (!visible(x) || !firstAt(x, style)) continue;
      if (!styles.has(style)) styles.set(style, []);
      styles.get(style).push(x);
      markerHits.push({ x, y: gestureRow, event });
    }
    context.lineWidth = 1.5;
    for (const [style, xs] of styles) {
      const [gesture, region] = style.split(' ');
      context.beginPath();
      for (const x of xs) addMarker(context, gesture, x, gestureRow, 5);
      const colour = REGION_COLOURS[Math.max(0, REGION_NAMES.indexOf(region))];
      if (gesture === 'may-begin' || gesture === 'cancel') {
        context.strokeStyle = colour;
        context.stroke();
      } else {
        context.fillStyle = colour;
        context.fill();
      }
    }

    context.font = '10px system-ui, sans-serif';
    context.textBaseline = 'middle';
    context.textAlign = 'left';
    let labelEnd = -Infinity;
    context.fillStyle = '#8e24aa';
    for (const reset of resets) {
      const x = xOf(reset.t);
      if (!visible(x) || x < labelEnd) continue;
      labelEnd = x + 30;
      context.fillText('reset', x + 3, gestureRow + 12);
    }
    labelEnd = -Infinity;
    for (const state of states) {
      const x = xOf(state.t);
      if (!visible(x)) continue;
      context.fillStyle = '#5e35b1';
      context.fillRect(x - 1, stateRow - 5, 2, 10);
      if (x > labelEnd) {
        const text = state.key + '=' + truncate(state.value, 24);
        context.fillText(text, x + 3, stateRow);
        labelEnd = x + 3 + context.measureText(text).width + 6;
      }
    }
    labelEnd = -Infinity;
    context.fillStyle = '#b36b00';
    for (const gap of gaps) {
      const x = xOf(gap.t);
      if (!visible(x) || x < labelEnd) continue;
      labelEnd = x + 70;
      context.fillText('gap ' + gap.previous + '→' + gap.frame, x + 3, stateRow + 12);
    }
  }

  function drawAxis(context, top) {
    const span = (view.end - view.start) / 1e6;
    const target = plotWidth() / 90;
    const steps = [0.001, 0.002, 0.005, 0.01, 0.02, 0.05, 0.1, 0.2, 0.5, 1, 2, 5, 10, 15, 30, 60, 120, 300, 600, 1200, 1800, 3600];
    let step = steps[steps.length - 1];
    for (const s of steps) if (span / s <= target) { step = s; break; }
    context.strokeStyle = '#9aa3ab';
    context.fillStyle = '#66707a';
    context.font = '10px system-ui, sans-serif';
    context.textAlign = 'center';
    context.textBaseline = 'top';
    context.beginPath();
    context.moveTo(MARGIN_LEFT, top + 0.5);
    context.lineTo(MARGIN_LEFT + plotWidth(), top + 0.5);
    const first = Math.ceil((view.start - fullStart) / 1e6 / step) * step;
    for (let s = first; fullStart + s * 1e6 <= view.end; s += step) {
      const x = Math.round(xOf(fullStart + s * 1e6)) + 0.5;
      context.moveTo(x, top);
      context.lineTo(x, top + 4);
      context.fillText(formatSeconds(s, step), x, top + 6);
    }
    context.stroke();
  }

  function drawLabels(context) {
    context.fillStyle = '#1d232a';
    context.font = '11px system-ui, sans-serif';
    context.textAlign = 'left';
    context.textBaseline = 'top';
    for (const lane of LANES) {
      if (lane.id === 'heat' || lane.id === 'axis') continue;
      const top = laneTop(lane.id);
      context.fillText(lane.label, MARGIN_LEFT + 4, top + (lane.id === 'region' ? 2 : 1));
    }
    context.fillText(showLevels ? 'levels' : 'readings', MARGIN_LEFT + 4, 2);
  }

  // The plot is drawn into a layer that only a change of view, of width or
  // of the heat map's source redraws; moving the cursor copies the layer and
  // draws one line.
  const chartLayer = document.createElement('canvas');
  let chartLayerKey = '';

  function drawLayer(context) {
    context.clearRect(0, 0, chart.clientWidth, chartHeight);
    const ratio = window.devicePixelRatio || 1;
    const columns = Math.max(1, Math.floor(plotWidth() * ratio));
    const spans = columnSpans(columns);
    drawHeat(context, spans, columns, laneTop('heat'), LANES[0].height);
    for (const lane of LANES) {
      if (!lane.column) continue;
      drawLine(context, spans, columns, col[lane.column], ranges[lane.column], lane.log, laneTop(lane.id), lane.height);
    }
    drawRegion(context, spans, columns, laneTop('region'), LANES[4].height);
    drawEvents(context, laneTop('events'), LANES[5].height);
    drawAxis(context, laneTop('axis'));
    drawLabels(context);
  }

  function drawChart() {
    const context = sizeCanvas(chart, chartHeight);
    const ratio = window.devicePixelRatio || 1;
    const key = [view.start, view.end, showLevels, chart.width, chart.height].join(',');
    if (key !== chartLayerKey) {
      // Setting a canvas's size reallocates it, even to the same size.
      if (chartLayer.width !== chart.width) chartLayer.width = chart.width;
      if (chartLayer.height !== chart.height) chartLayer.height = chart.height;
      const layer = chartLayer.getContext('2d');
      layer.setTransform(ratio, 0, 0, ratio, 0, 0);
      drawLayer(layer);
      chartLayerKey = key;
    }
    context.clearRect(0, 0, chart.clientWidth, chartHeight);
    context.drawImage(chartLayer, 0, 0, chart.clientWidth, chartHeight);
    if (cursor >= 0) {
      const x = Math.round(xOf(col.t[cursor])) + 0.5;
      context.strokeStyle = 'rgba(0, 0, 0, 0.55)';
      context.lineWidth = 1;
      context.beginPath();
      context.moveTo(x, 0);
      context.lineTo(x, laneTop('axis'));
      context.stroke();
    }
  }

  // The strip's bars depend only on its width: drawn once per width, then
  // copied under the view's window at every redraw.
  let overviewBars = null;
  function overviewBarsFor(width, height) {
    const ratio = window.devicePixelRatio || 1;
    if (overviewBars && overviewBars.width === Math.round(width * ratio)) return overviewBars;
    overviewBars = document.createElement('canvas');
    overviewBars.width = Math.round(width * ratio);
    overviewBars.height = Math.round(height * ratio);
    const context = overviewBars.getContext('2d');
    context.scale(ratio, ratio);
    const columns = Math.max(1, Math.floor(width));
    const span = (fullEnd - fullStart) / columns;
    const [low, high] = ranges.touch;
    let i = 0;
    for (let c = 0; c < columns; c++) {
      const c1 = fullStart + (c + 1) * span;
      let max = -Infinity;
      let region = 0;
      while (i < frameCount && col.t[i] < c1) {
        if (col.touch[i] > max) max = col.touch[i];
        if (col.region[i] && col.flags[i] & 1) region = col.region[i];
        i++;
      }
      if (max === -Infinity) continue;
      const h = Math.max(1, (Math.max(max, 0) - Math.min(low, 0)) / (high - Math.min(low, 0)) * (height - 10));
      context.fillStyle = region ? REGION_COLOURS[region] : '#c9d3dc';
      context.fillRect(c, height - 2 - h, 1, h);
    }
    return overviewBars;
  }

  function drawOverview() {
    const height = 44;
    const context = sizeCanvas(overview, height);
    const width = overview.clientWidth;
    context.clearRect(0, 0, width, height);
    context.drawImage(overviewBarsFor(width, height), 0, 0, width, height);
    const x0 = (view.start - fullStart) / (fullEnd - fullStart) * width;
    const x1 = (view.end - fullStart) / (fullEnd - fullStart) * width;
    context.fillStyle = 'rgba(31, 95, 191, 0.12)';
    context.fillRect(x0, 0, Math.max(2, x1 - x0), height);
    context.strokeStyle = '#1f5fbf';
    context.strokeRect(x0 + 0.5, 0.5, Math.max(2, x1 - x0) - 1, height - 1);
    if (overviewDrag) {
      const a = Math.min(overviewDrag.from, overviewDrag.to);
      const b = Math.max(overviewDrag.from, overviewDrag.to);
      context.fillStyle = 'rgba(0, 0, 0, 0.15)';
      context.fillRect(a, 0, b - a, height);
    }
  }

  function draw() {
    drawPending = false;
    drawChart();
    drawOverview();
    document.getElementById('view-range').textContent =
      formatSeconds((view.start - fullStart) / 1e6, 0.001) + ' – ' + formatSeconds((view.end - fullStart) / 1e6, 0.001) +
      ' (' + formatSeconds((view.end - view.start) / 1e6, 0.001) + ')';
  }

  function requestDraw() {
    if (drawPending) return;
    drawPending = true;
    window.requestAnimationFrame(draw);
  }

  // ---- text -------------------------------------------------------------------

  function formatNumber(v) {
    if (Math.abs(v) >= 1e5) return v.toExponential(1);
    if (Math.abs(v) >= 1000) return v.toFixed(0);
    if (Math.abs(v) >= 10) return v.toFixed(1);
    return v.toFixed(2);
  }

  function formatSeconds(s, step) {
    const digits = step >= 1 ? 0 : step >= 0.1 ? 1 : step >= 0.01 ? 2 : 3;
    return s.toFixed(digits) + 's';
  }

  function truncate(text, length) { return text.length > length ? text.slice(0, length - 1) + '…' : text; }

  // printf's %f of a float, digit for digit: six decimals, ties to even,
  // "nan", "inf" and the sign of -0. A float times 10^6 is exact in a double
  // (24 + 14 significant bits), so the rounding needs no decimal arithmetic.
  function printfFloat(v) {
    if (Number.isNaN(v)) return 'nan';
    if (!Number.isFinite(v)) return v > 0 ? 'inf' : '-inf';
    const sign = v < 0 || Object.is(v, -0) ? '-' : '';
    const scaled = Math.abs(v) * 1e6;
    let whole = Math.floor(scaled);
    const rest = scaled - whole;
    if (rest > 0.5 || (rest === 0.5 && whole % 2 === 1)) whole += 1;
    const digits = BigInt(whole).toString().padStart(7, '0');
    return sign + digits.slice(0, -6) + '.' + digits.slice(-6);
  }

  function pad4(v) { return String(v).padStart(4, ' '); }

  // The recogniser's per-frame description of the pads, rebuilt from the
  // numbers it recorded.
  function description(i) {
    let text = 'ts=' + printfFloat(col.touch[i]) + ', sd=' + printfFloat(col.signalPerDuration[i]) +
      ', tsd=' + printfFloat(col.signalPerTouchDuration[i]) + ', NonActivePixels=' + col.nonActive[i] +
      ', TimeDurationRatio=' + printfFloat(col.timeDurationRatio[i]) + ', TapSVMScore=' + printfFloat(col.tap[i]) + ', [';
    for (let pad = 0; pad < PAD_COUNT; pad++) {
      if (pad > 0) text += ', ';
      text += PAD_LETTERS[pad] + '=' + pad4(readings[pad][i]) + ' ' + pad4(levels[pad][i]) +
        (col.active[i] & (1 << pad) ? '<==ON' : '');
    }
    text += '] ';
    const phase = col.phase[i];
    if (phase > 0) {
      text += PHASE_WORDS[phase] + ' ' + col.phaseMs[i] + 'ms ActiveRegion=' + col.region[i];
      if (phase >= FIRST_RELEASE_PHASE) text += col.flags[i] & FLAG_ABOVE_NOISE ? ' ABOVENOISE' : ' BELOWNOISE';
    }
    return text;
  }

  function element(tag, attributes, text) {
    const node = document.createElement(tag);
    for (const [name, value] of Object.entries(attributes || {})) node.setAttribute(name, value);
    if (text !== undefined) node.textContent = text;
    return node;
  }

  function showFrame(i) {
    info.replaceChildren();
    if (i < 0) return;
    info.appendChild(element('div', { class: 'head' },
      'Frame ' + col.frame[i] + ' @' + col.timeMs[i] + 'ms · ' + formatSeconds((col.t[i] - fullStart) / 1e6, 0.001) +
      ' · region ' + REGION_NAMES[col.region[i]] + ' · SVM ' + printfFloat(col.svm[i]) +
      ' · touch ' + printfFloat(col.touch[i]) + ' · tap ' + printfFloat(col.tap[i])));
    const table = element('table');
    const head = element('tr');
    head.appendChild(element('th', {}, ''));
    for (let pad = 0; pad < PAD_COUNT; pad++) head.appendChild(element('th', {}, PAD_LETTERS[pad]));
    table.appendChild(head);
    for (const [label, source] of [['reading', readings], ['level', levels]]) {
      const row = element('tr');
      row.appendChild(element('th', {}, label));
      for (let pad = 0; pad < PAD_COUNT; pad++) {
        row.appendChild(element('td', col.active[i] & (1 << pad) ? { class: 'on' } : {}, String(source[pad][i])));
      }
      table.appendChild(row);
    }
    info.appendChild(table);
    info.appendChild(element('pre', { id: 'description' }, description(i)));
    const here = eventsByFrame.get(i) || [];
    const marks = here.map((event) => event.gesture + (event.gesture === 'device-reset' ? '' : ' ' + event.region));
    for (const state of states) if (state.i === i) marks.push('set ' + state.key + '=' + state.value);
    for (const gap of gaps) if (gap.i === i) marks.push('gap after frame ' + gap.previous);
    if (marks.length) info.appendChild(element('div', { id: 'frame-events' }, 'Events: ' + marks.join(', ')));
  }

  // ---- interaction ------------------------------------------------------------

  function setView(start, end) {
    let span = Math.min(Math.max(end - start, minSpan), fullEnd - fullStart);
    if (span <= 0) span = minSpan;
    start = Math.min(Math.max(start, fullStart), fullEnd - span);
    view.start = start;
    view.end = start + span;
    requestDraw();
  }

  function setCursor(i) {
    if (!frameCount) return;
    cursor = Math.min(Math.max(i, 0), frameCount - 1);
    const t = col.t[cursor];
    const span = view.end - view.start;
    if (t < view.start || t > view.end) setView(t - span / 2, t + span / 2);
    showFrame(cursor);
    requestDraw();
  }

  function zoomToTime(t, span) { setView(t - span / 2, t + span / 2); }

  let drag = null;
  chart.addEventListener('wheel', (event) => {
    event.preventDefault();
    const rect = chart.getBoundingClientRect();
    const t = tOf(event.clientX - rect.left);
    const factor = Math.exp(Math.max(-1, Math.min(1, event.deltaY * 0.002)));
    setView(t - (t - view.start) * factor, t + (view.end - t) * factor);
  }, { passive: false });

  chart.addEventListener('mousedown', (event) => {
    drag = { x: event.clientX, start: view.start, end: view.end, moved: false };
    chart.classList.add('dragging');
    chart.focus();
  });
  window.addEventListener('mousemove', (event) => {
    const rect = chart.getBoundingClientRect();
    if (drag) {
      const dx = event.clientX - drag.x;
      if (Math.abs(dx) > 3) drag.moved = true;
      if (drag.moved) {
        const shift = dx / plotWidth() * (drag.end - drag.start);
        setView(drag.start - shift, drag.end - shift);
      }
      return;
    }
    const x = event.clientX - rect.left;
    const y = event.clientY - rect.top;
    if (x >= MARGIN_LEFT && x <= rect.width - MARGIN_RIGHT && y >= 0 && y <= rect.height && frameCount) {
      const i = nearestFrame(tOf(x));
      if (i !== cursor) {
        cursor = i;
        showFrame(i);
        requestDraw();
      }
    }
  });
  window.addEventListener('mouseup', (event) => {
    if (!drag) return;
    const moved = drag.moved;
    drag = null;
    chart.classList.remove('dragging');
    if (moved) return;
    const rect = chart.getBoundingClientRect();
    const x = event.clientX - rect.left;
    const y = event.clientY - rect.top;
    let best = null;
    for (const hit of markerHits) {
      const d = Math.hypot(hit.x - x, hit.y - y);
      if (d <= 8 && (!best || d < best.d)) best = { d, hit };
    }
    if (best) zoomTo(best.hit.event);
  });

  // A gesture is shown with the touch it belongs to: from its may-begin to
  // the event that ends it, with some room on either side.
  function zoomTo(event) {
    const index = events.indexOf(event);
    let from = event.t;
    let to = event.t;
    for (let k = index; k >= 0 && events[k].gesture !== 'device-reset'; k--) {
      from = events[k].t;
      if (events[k].gesture === 'may-begin') break;
    }
    for (let k = index; k < events.length && events[k].gesture !== 'device-reset'; k++) {
      to = events[k].t;
      if (k > index && events[k].gesture === 'may-begin') { to = events[k - 1].t; break; }
      if (['tap', 'hold-end', 'cancel'].includes(events[k].gesture)) break;
    }
    const room = Math.max((to - from) * 0.4, 300000);
    setView(from - room, to + room);
    setCursor(event.i);
  }

  document.addEventListener('keydown', (event) => {
    if (event.key !== 'ArrowLeft' && event.key !== 'ArrowRight') return;
    event.preventDefault();
    const step = (event.shiftKey ? 10 : 1) * (event.key === 'ArrowLeft' ? -1 : 1);
    setCursor(cursor < 0 ? lowerBound(view.start) : cursor + step);
  });

  let overviewDrag = null;
  function overviewTime(event) {
    const rect = overview.getBoundingClientRect();
    return { x: event.clientX - rect.left, t: fullStart + (event.clientX - rect.left) / rect.width * (fullEnd - fullStart) };
  }
  overview.addEventListener('mousedown', (event) => {
    const at = overviewTime(event);
    overviewDrag = { from: at.x, to: at.x, tFrom: at.t, tTo: at.t };
  });
  window.addEventListener('mousemove', (event) => {
    if (!overviewDrag) return;
    const at = overviewTime(event);
    overviewDrag.to = at.x;
    overviewDrag.tTo = at.t;
    requestDraw();
  });
  window.addEventListener('mouseup', () => {
    if (!overviewDrag) return;
    const { from, to, tFrom, tTo } = overviewDrag;
    overviewDrag = null;
    if (Math.abs(to - from) < 3) zoomToTime(tFrom, view.end - view.start);
    else setView(Math.min(tFrom, tTo), Math.max(tFrom, tTo));
  });

  const levelsButton = document.getElementById('toggle-levels');
  levelsButton.addEventListener('click', () => {
    showLevels = !showLevels;
    levelsButton.setAttribute('aria-pressed', String(showLevels));
    levelsButton.textContent = showLevels ? 'Show readings' : 'Show levels';
    requestDraw();
  });
  document.getElementById('whole').addEventListener('click', () => setView(fullStart, fullEnd));
  window.addEventListener('resize', requestDraw);

  // ---- tables and the list of events --------------------------------------------

  function fillTables() {
    const counters = document.querySelector('#counters tbody');
    for (const [group, values] of Object.entries(data.counters)) {
      for (const [name, value] of Object.entries(values)) {
        const row = element('tr', { 'data-group': group, 'data-key': name });
        row.appendChild(element('td', {}, group));
        row.appendChild(element('td', {}, name));
        row.appendChild(element('td', { class: 'num' }, value));
        counters.appendChild(row);
      }
    }
    const facts = data.facts;
    const seconds = Number(facts.durationNs) / 1e9;
    const rows = [
      ['source', 'Recording', facts.source],
      ['frames', 'Frames', String(facts.frames)],
      ['reports', 'Input reports', String(facts.reports)],
      ['state-frames', 'State frames', String(facts.stateFrames)],
      ['page-frames', 'Recogniser frames shown', String(facts.pageFrames) + (facts.frameRange ? ' (frames ' + facts.frameRange + ')' : '')],
      ['duration', 'Duration', seconds.toFixed(3) + ' s'],
      ['format', 'Format', facts.format],
      ['first-timestamp', 'First time stamp (ns)', facts.firstTimestampNs],
      ['last-timestamp', 'Last time stamp (ns)', facts.lastTimestampNs],
      ['ignored-reports', 'Reports not understood', String(data.ignoredReports)],
      ['gaps', 'Gaps in frame numbers', String(gaps.length)],
    ];
    for (const [key, value] of facts.settings) rows.push(['setting', 'Set before the first frame', key + '=' + value]);
    const factBody = document.querySelector('#facts tbody');
    for (const [id, label, value] of rows) {
      const row = element('tr', { 'data-fact': id });
      row.appendChild(element('th', {}, label));
      row.appendChild(element('td', {}, value));
      factBody.appendChild(row);
    }
    const stateBody = document.querySelector('#states tbody');
    for (const state of states) {
      const row = element('tr');
      row.appendChild(element('td', { class: 'num' }, state.i < frameCount ? String(col.frame[state.i]) : 'end'));
      row.appendChild(element('td', { class: 'num' }, formatSeconds((state.t - fullStart) / 1e6, 0.001)));
      row.appendChild(element('td', {}, state.key));
      row.appendChild(element('td', {}, state.value));
      stateBody.appendChild(row);
    }
    document.getElementById('summary').textContent =
      facts.frames + ' frames, ' + seconds.toFixed(1) + ' s, ' + gestures.length + ' gestures, ' + resets.length +
      ' device resets, ' + states.length + ' state writes, ' + gaps.length + ' gaps';

    // Every marker drawn is listed here, in the order the pipeline emitted them.
    const list = document.getElementById('events');
    const items = document.createDocumentFragment();
    for (const event of events) {
      items.appendChild(element('li', {
        'data-gesture': event.gesture,
        'data-region': event.region,
        'data-frame': String(event.frame),
        'data-time-us': String(event.t - fullStart),
      }, event.gesture + ' ' + event.region + ' frame ' + event.frame));
    }
    list.appendChild(items);
  }

  // #frame=N selects the first frame with that number and zooms to it.
  function frameFromLocation() {
    const match = /^#frame=(\d+)$/.exec(window.location.hash);
    if (!match) return;
    const wanted = Number(match[1]);
    for (let i = 0; i < frameCount; i++) {
      if (col.frame[i] === wanted) {
        zoomToTime(col.t[i], Math.max(minSpan, 2e6));
        setCursor(i);
        return;
      }
    }
  }

  // For scripts that measure the page: move the view and draw at once.
  window.veltoReport = {
    fullStart, fullEnd, view,
    show(start, end) {
      setView(start, end);
      draw();
    },
  };

  fillTables();
  frameFromLocation();
  draw();
  document.body.setAttribute('data-draw-ms', performance.now().toFixed(0));
  document.body.setAttribute('data-ready', '1');
})();
