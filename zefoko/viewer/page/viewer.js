// The performance viewer: the robot's timeline drawn as lanes on one time axis (the
// waveform, words, bookmarks, actions, behaviours, sounds, memory events, joint curves)
// and a front view of the robot's upper body drawn from the sampled joint angles. The
// same script draws a recorded performance (its timeline and audio embedded in the page)
// and the live page of a running robot (timeline entries streamed as server-sent events).
"use strict";
(function () {
  const SVG = "http://www.w3.org/2000/svg";
  const LABEL_WIDTH = 112;
  const LIVE_WINDOW_US = 20e6;

  const OUTCOMES = [
    ["executed", "#1e8e3e"],
    ["skipped", "#9aa0a6"],
    ["stopped", "#e8710a"],
    ["failed", "#d93025"],
    ["no animation", "#a142f4"],
  ];
  const OUTCOME_COLOUR = new Map(OUTCOMES);
  const OTHER_OUTCOME = "#5f6368";
  const COLOURS = {
    gesture: "#1a73e8",
    bodyTalk: "#8ab4f8",
    sound: "#12b5cb",
    cut: "#d93025",
    bookmark: "#f9ab00",
    hold: "#fde293",
    event: "#9334e6",
    wave: "#3c4043",
    word: "#202124",
    cursor: "#d93025",
  };
  const JOINT_GROUPS = [
    ["head", (n) => n.startsWith("Head")],
    ["left arm", (n) => n.startsWith("L")],
    ["right arm", (n) => n.startsWith("R")],
  ];
  const CURVE_COLOURS = ["#1a73e8", "#d93025", "#f9ab00", "#1e8e3e", "#a142f4", "#12b5cb"];

  // ---- the model: what the timeline entries say, by lane -------------------------------

  function newModel(data) {
    return {
      originUs: data.originUs || 0,
      endUs: data.endUs || 0,
      sampleUs: data.sampleUs || 20000,
      joints: data.joints || [],
      words: [],
      bookmarks: [],
      actions: [],
      behaviours: [],
      sounds: [],
      events: [],
      speech: [],
      angles: new Map(), // joint name -> [[us, radians], ...] in time order
      lastUs: 0,
    };
  }

  function openInterval(list, key, us, extra) {
    list.push(Object.assign({ key: key, startUs: us, endUs: null }, extra));
  }

  function closeInterval(list, key, us, extra) {
    for (const item of list) {
      if (item.key === key && item.endUs === null) {
        item.endUs = us;
        Object.assign(item, extra);
        return;
      }
    }
  }

  function addEntry(model, e) {
    const args = e.arguments;
    const arg = (k) => (Array.isArray(args) && k < args.length ? args[k] : undefined);
    model.lastUs = Math.max(model.lastUs, e.us);
    switch (e.service + "." + e.operation) {
      case "ZUTextToSpeech.word":
        model.words.push({ us: e.us, text: String(arg(3)) });
        break;
      case "ZUTextToSpeech.started":
        openInterval(model.speech, arg(0), e.us, {});
        break;
      case "ZUTextToSpeech.done":
      case "ZUTextToSpeech.stopped":
        closeInterval(model.speech, arg(0), e.us, {});
        break;
      case "ZUTextToSpeech.bookmark":
        model.bookmarks.push({ us: e.us, number: arg(1), heldUntilUs: null });
        break;
      case "ZUTextToSpeech.hold":
        model.bookmarks.push({ us: e.us, number: arg(1), heldUntilUs: e.us, holding: true });
        break;
      case "ZUTextToSpeech.mrkpause":
        for (const b of model.bookmarks) {
          if (b.holding && b.number === arg(1)) {
            b.heldUntilUs = e.us;
            b.holding = false;
          }
        }
        break;
      case "ZUMokuto.action":
        if (args && typeof args === "object" && !Array.isArray(args) && "type" in args)
          model.actions.push(Object.assign({ us: e.us }, args));
        break;
      case "ZUBehaviorManager.startBehavior":
        openInterval(model.behaviours, arg(0), e.us, { name: String(arg(0)) });
        break;
      case "ZUBehaviorManager.behaviorStopped":
        closeInterval(model.behaviours, arg(0), e.us, {});
        break;
      case "ZUAudioPlayer.playSoundSetFile":
        openInterval(model.sounds, arg(0) + "/" + arg(1), e.us, {
          name: arg(0) + "/" + arg(1),
          volume: arg(2),
          stopped: false,
        });
        break;
      case "ZUAudioPlayer.soundEnded":
        closeInterval(model.sounds, arg(0) + "/" + arg(1), e.us, {});
        break;
      case "ZUAudioPlayer.soundStopped":
        closeInterval(model.sounds, arg(0) + "/" + arg(1), e.us, { stopped: true });
        break;
      case "ZUMemory.raiseEvent":
        if (!String(arg(0)).startsWith("ZUTextToSpeech/"))
          model.events.push({ us: e.us, key: String(arg(0)), value: JSON.stringify(arg(1)) });
        break;
      case "ZUMotion.angles":
        if (args && typeof args === "object") {
          for (const [name, value] of Object.entries(args)) {
            if (!model.angles.has(name)) model.angles.set(name, []);
            model.angles.get(name).push([e.us, value]);
          }
        }
        break;
      default:
        break;
    }
  }

  // A joint's angle at `us`: its last sample, moving in a straight line to the next one
  // over the sampling period before it (a joint still between two samples far apart held
  // its angle until it moved again).
  function angleAt(model, name, us) {
    const series = model.angles.get(name);
    if (!series || series.length === 0) {
      const joint = model.joints.find((j) => j.name === name);
      return joint ? joint.rest : 0;
    }
    let lo = 0;
    let hi = series.length - 1;
    if (us < series[0][0]) return series[0][1];
    while (lo < hi) {
      const mid = (lo + hi + 1) >> 1;
      if (series[mid][0] <= us) lo = mid;
      else hi = mid - 1;
    }
    const [t0, a0] = series[lo];
    if (lo + 1 >= series.length) return a0;
    const [t1, a1] = series[lo + 1];
    const from = Math.max(t0, t1 - model.sampleUs);
    if (us <= from) return a0;
    return a0 + ((a1 - a0) * (us - from)) / (t1 - from);
  }

  function anglesAt(model, us) {
    const out = {};
    for (const joint of model.joints) out[joint.name] = angleAt(model, joint.name, us);
    return out;
  }

  // ---- drawing helpers --------------------------------------------------------------

  function el(name, attrs, parent, text) {
    const node = document.createElementNS(SVG, name);
    for (const [k, v] of Object.entries(attrs || {})) node.setAttribute(k, v);
    if (text !== undefined) node.textContent = text;
    if (parent) parent.appendChild(node);
    return node;
  }

  function titled(node, text) {
    el("title", {}, node, text);
    return node;
  }

  function seconds(us, digits) {
    return (us / 1e6).toFixed(digits === undefined ? 3 : digits);
  }

  function outcomeColour(outcome) {
    return OUTCOME_COLOUR.get(outcome) || OTHER_OUTCOME;
  }

  // Rows of non-overlapping intervals: the row of each item, and the number of rows.
  function packRows(items, endOf) {
    const rowEnds = [];
    const rows = items.map((item) => {
      let row = rowEnds.findIndex((end) => end <= item.startUs);
      if (row < 0) {
        row = rowEnds.length;
        rowEnds.push(0);
      }
      rowEnds[row] = endOf(item) + 1;
      return row;
    });
    return { rows: rows, count: Math.max(1, rowEnds.length) };
  }

  // ---- the lanes --------------------------------------------------------------------

  class Lanes {
    constructor(svg, onSeek) {
      this.svg = svg;
      this.onSeek = onSeek;
      this.cursor = null;
      svg.addEventListener("click", (event) => {
        if (!this.scale) return;
        const box = svg.getBoundingClientRect();
        const x = event.clientX - box.left;
        if (x >= LABEL_WIDTH) this.onSeek(this.scale.usAt(x));
      });
    }

    render(model, fromUs, toUs, waveform, nowUs) {
      const svg = this.svg;
      while (svg.firstChild) svg.removeChild(svg.firstChild);
      const width = Math.max(600, svg.parentNode.clientWidth || 1000);
      const plot = width - LABEL_WIDTH - 12;
      const span = Math.max(1, toUs - fromUs);
      const x = (us) => LABEL_WIDTH + ((us - fromUs) / span) * plot;
      this.scale = { x: x, usAt: (px) => fromUs + ((px - LABEL_WIDTH) / plot) * span };
      const clip = (us) => Math.min(Math.max(us, fromUs), toUs);
      const openEnd = nowUs !== undefined ? nowUs : toUs;
      let y = 0;
      const lane = (label, height, draw) => {
        const g = el("g", { transform: "translate(0," + y + ")", "data-lane": label }, svg);
        el("line", { x1: 0, x2: width, y1: height, y2: height, stroke: "#eee" }, g);
        el("text", { x: 6, y: Math.min(height / 2 + 4, 16), class: "lane-label" }, g, label);
        draw(g, height);
        y += height;
      };
      const bar = (g, startUs, endUs, top, height, fill, label, tip) => {
        const x0 = x(clip(startUs));
        const x1 = Math.max(x0 + 3, x(clip(endUs)));
        const rect = el("rect", { x: x0, y: top, width: x1 - x0, height: height, rx: 2, fill: fill }, g);
        titled(rect, tip);
        if (label && x1 - x0 > 30) {
          fitText(el("text", { x: x0 + 4, y: top + height - 4, class: "bar-label" }, g, label), x1 - x0 - 8);
        }
        return rect;
      };

      lane("time (s)", 24, (g) => {
        const step = niceStep(span / 1e6, plot / 70);
        const first = Math.ceil(fromUs / 1e6 / step) * step;
        for (let t = first; t * 1e6 <= toUs; t += step) {
          const px = x(t * 1e6);
          el("line", { x1: px, x2: px, y1: 16, y2: 24, stroke: "#9aa0a6" }, g);
          el("text", { x: px + 2, y: 13, class: "tick" }, g, t.toFixed(step < 1 ? 1 : 0));
        }
      });
      if (waveform) {
        lane("waveform", 56, (g, h) => {
          let d = "";
          for (let px = 0; px < plot; px++) {
            const [lo, hi] = waveform.range(this.scale.usAt(LABEL_WIDTH + px), this.scale.usAt(LABEL_WIDTH + px + 1));
            const cx = LABEL_WIDTH + px + 0.5;
            d += "M" + cx + " " + (h / 2 - hi * (h / 2 - 2)) + "V" + (h / 2 - lo * (h / 2 - 2) + 0.5);
          }
          el("path", { d: d, stroke: COLOURS.wave, "stroke-width": 1, fill: "none" }, g);
        });
      }
      lane("words", 34, (g) => {
        model.words.forEach((w, k) => {
          if (w.us < fromUs || w.us > toUs) return;
          const px = x(w.us);
          el("line", { x1: px, x2: px, y1: 2, y2: 32, stroke: "#dadce0" }, g);
          titled(el("text", { x: px + 2, y: k % 2 ? 28 : 14 }, g, w.text), w.text + " at " + seconds(w.us - model.originUs) + " s");
        });
      });
      lane("bookmarks", 24, (g) => {
        for (const b of model.bookmarks) {
          if (b.heldUntilUs !== null) {
            const end = b.holding ? openEnd : b.heldUntilUs;
            titled(el("rect", { x: x(clip(b.us)), y: 3, width: Math.max(2, x(clip(end)) - x(clip(b.us))), height: 18, fill: COLOURS.hold }, g),
              "bookmark " + b.number + ": the speech waits " + seconds(end - b.us) + " s for its action");
          }
          if (b.us < fromUs || b.us > toUs) continue;
          const px = x(b.us);
          el("line", { x1: px, x2: px, y1: 2, y2: 22, stroke: COLOURS.bookmark, "stroke-width": 2 }, g);
          titled(el("text", { x: px + 3, y: 16 }, g, String(b.number)), "bookmark " + b.number + " at " + seconds(b.us - model.originUs) + " s");
        }
      });
      const actionRow = 18;
      const actionStart = (a) => (a.startUs !== null && a.startUs !== undefined ? a.startUs : a.arrivedUs || a.bookmarkUs || a.us);
      const actionEnd = (a) => (a.endUs !== null && a.endUs !== undefined ? a.endUs : actionStart(a));
      // One row per action in view (the live page's texts come and go).
      const shownActions = model.actions.filter((a) => actionEnd(a) >= fromUs && actionStart(a) <= toUs);
      lane("actions", Math.max(24, shownActions.length * actionRow + 4), (g) => {
        shownActions.forEach((a, k) => {
          const start = actionStart(a);
          const end = actionEnd(a);
          const sync = a.startUs != null && a.bookmarkUs != null ? ((a.startUs - a.bookmarkUs) / 1000).toFixed(2) + " ms" : "";
          const shown = a.error ? a.text.substring(a.error.length + 1) : a.text;
          const label = (shown.startsWith(a.type) ? "" : a.type + " ") + shown + " · " + a.outcome + (a.error ? ": " + a.error : "") + (sync ? " · sync " + sync : "");
          const tip = label + "\nbookmark " + a.bookmark + (a.startUs != null ? "\nstarted " + seconds(a.startUs - model.originUs) + " s" : "") +
            (a.endUs != null ? ", ended " + seconds(a.endUs - model.originUs) + " s" : "");
          const top = 2 + k * actionRow;
          bar(g, start, end, top, actionRow - 3, outcomeColour(a.outcome), null, tip).setAttribute("data-outcome", a.outcome);
          const text = el("text", { x: Math.max(x(clip(start)), LABEL_WIDTH) + 6 + Math.max(3, x(clip(end)) - x(clip(start))), y: top + 12, class: "bar-label dark" }, g, label);
          fitText(text, width - Number(text.getAttribute("x")) - 4);
        });
      });
      const intervalLane = (label, items, colourOf, textOf, tipOf) => {
        const shown = items.filter((i) => (i.endUs === null ? openEnd : i.endUs) >= fromUs && i.startUs <= toUs);
        const packed = packRows(shown, (i) => (i.endUs === null ? openEnd : i.endUs));
        lane(label, Math.max(24, packed.count * 18 + 4), (g) => {
          shown.forEach((i, k) => {
            const end = i.endUs === null ? openEnd : i.endUs;
            const rect = bar(g, i.startUs, end, 2 + packed.rows[k] * 18, 15, colourOf(i), textOf(i), tipOf(i, end));
            rect.setAttribute("data-name", i.name);
            if (i.stopped) {
              const px = x(clip(end));
              el("line", { x1: px, x2: px, y1: 2 + packed.rows[k] * 18 - 1, y2: 2 + packed.rows[k] * 18 + 16, stroke: COLOURS.cut, "stroke-width": 3 }, g);
            }
          });
        });
      };
      intervalLane("behaviours", model.behaviours,
        (b) => (b.name.includes("/BodyTalk/") ? COLOURS.bodyTalk : COLOURS.gesture),
        (b) => b.name.substring(b.name.lastIndexOf("/") + 1),
        (b, end) => b.name + "\n" + seconds(b.startUs - model.originUs) + " s to " + seconds(end - model.originUs) + " s");
      intervalLane("sounds", model.sounds, () => COLOURS.sound, (s) => s.name,
        (s, end) => s.name + " (volume " + s.volume + ")" + (s.stopped ? ", stopped" : "") + "\n" +
          seconds(s.startUs - model.originUs) + " s to " + seconds(end - model.originUs) + " s");
      lane("memory events", 24, (g) => {
        for (const e of model.events) {
          if (e.us < fromUs || e.us > toUs) continue;
          const px = x(e.us);
          el("circle", { cx: px, cy: 12, r: 4, fill: COLOURS.event }, g);
          // Near the right end, the label goes to the left of its mark.
          const left = px > width - 200;
          titled(el("text", { x: left ? px - 6 : px + 6, y: 16, "text-anchor": left ? "end" : "start" }, g, e.key + " = " + e.value),
            e.key + " = " + e.value + " at " + seconds(e.us - model.originUs) + " s");
        }
      });
      for (const [group, member] of JOINT_GROUPS) {
        const names = [...model.angles.keys()].filter((n) => member(n) && model.angles.get(n).length > 1);
        if (names.length === 0) continue;
        lane(group + " (rad)", 74, (g, h) => {
          let lo = Infinity;
          let hi = -Infinity;
          for (const n of names) {
            for (const [, v] of model.angles.get(n)) {
              lo = Math.min(lo, v);
              hi = Math.max(hi, v);
            }
          }
          if (hi - lo < 0.2) {
            lo -= 0.1;
            hi += 0.1;
          }
          const yOf = (v) => h - 4 - ((v - lo) / (hi - lo)) * (h - 8);
          el("text", { x: 6, y: h - 6, class: "tick" }, g, lo.toFixed(2) + " … " + hi.toFixed(2));
          names.forEach((n, k) => {
            const colour = CURVE_COLOURS[k % CURVE_COLOURS.length];
            let d = "";
            let last = null;
            for (const [us, v] of model.angles.get(n)) {
              if (us < fromUs - 1e6 || us > toUs + 1e6) continue;
              if (last !== null && us - last[0] > model.sampleUs * 1.5) d += "L" + x(clip(us - model.sampleUs)) + " " + yOf(last[1]);
              d += (d ? "L" : "M") + x(clip(us)) + " " + yOf(v);
              last = [us, v];
            }
            if (last !== null) d += "L" + x(clip(openEnd)) + " " + yOf(last[1]);
            titled(el("path", { d: d, stroke: colour, "stroke-width": 1.5, fill: "none", "data-joint": n }, g), n);
            el("text", { x: width - 12 - (names.length - k) * 96, y: 12, fill: colour }, g, n);
          });
        });
      }
      svg.setAttribute("viewBox", "0 0 " + width + " " + y);
      svg.setAttribute("height", y);
      this.cursor = el("line", { x1: 0, x2: 0, y1: 0, y2: y, stroke: COLOURS.cursor, "stroke-width": 1.5, "pointer-events": "none" }, svg);
    }

    moveCursor(us) {
      if (!this.cursor || !this.scale) return;
      const px = this.scale.x(us);
      this.cursor.setAttribute("x1", px);
      this.cursor.setAttribute("x2", px);
    }
  }

  function niceStep(spanSeconds, maxTicks) {
    for (const step of [0.1, 0.2, 0.5, 1, 2, 5, 10, 20, 30, 60, 120]) {
      if (spanSeconds / step <= maxTicks) return step;
    }
    return 300;
  }

  // Shortens a label until it fits `width` pixels.
  function fitText(text, width) {
    if (width <= 10) {
      text.textContent = "";
      return;
    }
    const full = text.textContent;
    let length = full.length;
    while (length > 1 && text.getComputedTextLength && text.getComputedTextLength() > width) {
      length = Math.floor(length * 0.8);
      text.textContent = full.substring(0, length) + "…";
    }
  }

  // ---- the waveform of the embedded WAV ------------------------------------------------

  function decodeWav(dataUrl, originUs) {
    const comma = dataUrl.indexOf(",");
    const binary = atob(dataUrl.substring(comma + 1));
    const bytes = new Uint8Array(binary.length);
    for (let i = 0; i < binary.length; i++) bytes[i] = binary.charCodeAt(i);
    const view = new DataView(bytes.buffer);
    let rate = 22050;
    let at = 12;
    while (at + 8 <= bytes.length) {
      const id = String.fromCharCode(bytes[at], bytes[at + 1], bytes[at + 2], bytes[at + 3]);
      const size = view.getUint32(at + 4, true);
      if (id === "fmt ") rate = view.getUint32(at + 12, true);
      if (id === "data") {
        const count = Math.floor(Math.min(size, bytes.length - at - 8) / 2);
        const samples = new Int16Array(count);
        for (let i = 0; i < count; i++) samples[i] = view.getInt16(at + 8 + 2 * i, true);
        return {
          rate: rate,
          seconds: count / rate,
          range(fromUs, toUs) {
            const a = Math.max(0, Math.floor(((fromUs - originUs) / 1e6) * rate));
            const b = Math.min(count, Math.ceil(((toUs - originUs) / 1e6) * rate));
            let lo = 0;
            let hi = 0;
            for (let i = a; i < b; i++) {
              lo = Math.min(lo, samples[i]);
              hi = Math.max(hi, samples[i]);
            }
            return [lo / 32768, hi / 32768];
          },
        };
      }
      at += 8 + size + (size % 2);
    }
    return null;
  }

  // ---- the front view of the upper body ------------------------------------------------

  // Rotations of the robot's frame: x forward, y to its left, z up.
  const rot = {
    x: (a) => [[1, 0, 0], [0, Math.cos(a), -Math.sin(a)], [0, Math.sin(a), Math.cos(a)]],
    y: (a) => [[Math.cos(a), 0, Math.sin(a)], [0, 1, 0], [-Math.sin(a), 0, Math.cos(a)]],
    z: (a) => [[Math.cos(a), -Math.sin(a), 0], [Math.sin(a), Math.cos(a), 0], [0, 0, 1]],
  };
  function mul(a, b) {
    return a.map((row) => [0, 1, 2].map((j) => row[0] * b[0][j] + row[1] * b[1][j] + row[2] * b[2][j]));
  }
  function apply(m, v) {
    return m.map((row) => row[0] * v[0] + row[1] * v[1] + row[2] * v[2]);
  }
  function add(a, b, k) {
    return [a[0] + k * b[0], a[1] + k * b[1], a[2] + k * b[2]];
  }

  const BODY = { shoulderY: 98, shoulderZ: 100, upperArm: 105, forearm: 100, hand: 48, neckZ: 126, headZ: 178, head: 50 };

  // The points of one arm, in the robot's frame; `side` 1 for the left, -1 for the right.
  function armPoints(angles, prefix, side) {
    const shoulder = [0, side * BODY.shoulderY, BODY.shoulderZ];
    const upper = mul(rot.y(angles[prefix + "ShoulderPitch"]), rot.z(angles[prefix + "ShoulderRoll"]));
    const elbow = add(shoulder, apply(upper, [1, 0, 0]), BODY.upperArm);
    const fore = mul(mul(upper, rot.x(angles[prefix + "ElbowYaw"])), rot.z(angles[prefix + "ElbowRoll"]));
    const wrist = add(elbow, apply(fore, [1, 0, 0]), BODY.forearm);
    const hand = mul(fore, rot.x(angles[prefix + "WristYaw"]));
    const tip = add(wrist, apply(hand, [1, 0, 0]), BODY.hand);
    const across = apply(hand, [0, 1, 0]);
    return { shoulder: shoulder, elbow: elbow, wrist: wrist, tip: tip, across: across, open: angles[prefix + "Hand"] };
  }

  class Figure {
    constructor(svg) {
      this.svg = svg;
      this.drawn = null;
    }

    // Seen from the front: the robot's left on the right of the picture.
    project(p) {
      return [130 + p[1] * 0.52, 195 - p[2] * 0.52, p[0]];
    }

    draw(angles) {
      const svg = this.svg;
      while (svg.firstChild) svg.removeChild(svg.firstChild);
      const P = (p) => this.project(p);
      const shapes = [];
      // The torso and the neck stand behind the arms that are in front of the body.
      const torso = [[0, 70, 118], [0, -70, 118], [0, -62, -40], [0, 62, -40]].map(P);
      el("polygon", { points: torso.map((p) => p[0] + "," + p[1]).join(" "), fill: "#e8eaed", stroke: "#9aa0a6" }, svg);
      const neck = [P([0, 0, 118]), P([0, 0, BODY.neckZ + 10])];
      el("line", { x1: neck[0][0], y1: neck[0][1], x2: neck[1][0], y2: neck[1][1], stroke: "#9aa0a6", "stroke-width": 14 }, svg);
      for (const [prefix, side, colour] of [["L", 1, "#1a73e8"], ["R", -1, "#d93025"]]) {
        const arm = armPoints(angles, prefix, side);
        const segments = [[arm.shoulder, arm.elbow, 15], [arm.elbow, arm.wrist, 12]];
        for (const [a, b, w] of segments) shapes.push({ depth: (a[0] + b[0]) / 2, kind: "limb", a: P(a), b: P(b), w: w, colour: colour, joint: prefix });
        const spread = 5 + 9 * Math.max(0, Math.min(1, arm.open));
        const corners = [add(arm.wrist, arm.across, -5), add(arm.wrist, arm.across, 5), add(arm.tip, arm.across, spread), add(arm.tip, arm.across, -spread)].map(P);
        shapes.push({ depth: (arm.wrist[0] + arm.tip[0]) / 2, kind: "hand", corners: corners, colour: colour });
        for (const p of [arm.shoulder, arm.elbow, arm.wrist]) shapes.push({ depth: p[0] + 1, kind: "joint", at: P(p) });
      }
      shapes.sort((a, b) => a.depth - b.depth);
      const behind = shapes.filter((s) => s.depth < 0);
      const front = shapes.filter((s) => s.depth >= 0);
      const drawShape = (s) => {
        const shade = Math.max(0.45, Math.min(1, 0.75 + s.depth / 400));
        if (s.kind === "limb") {
          el("line", { x1: s.a[0], y1: s.a[1], x2: s.b[0], y2: s.b[1], stroke: s.colour, "stroke-width": s.w * (0.8 + shade * 0.3), "stroke-linecap": "round", opacity: shade }, svg);
        } else if (s.kind === "hand") {
          el("polygon", { points: s.corners.map((p) => p[0] + "," + p[1]).join(" "), fill: s.colour, opacity: shade * 0.8, stroke: "#3c4043", "stroke-width": 1 }, svg);
        } else {
          el("circle", { cx: s.at[0], cy: s.at[1], r: 5, fill: "#fff", stroke: "#3c4043", "stroke-width": 1.5 }, svg);
        }
      };
      behind.forEach(drawShape);
      this.drawHead(angles, P);
      front.forEach(drawShape);
      this.drawn = Object.assign({}, angles);
    }

    drawHead(angles, P) {
      const svg = this.svg;
      const centre = [0, 0, BODY.headZ];
      const c = P(centre);
      el("circle", { cx: c[0], cy: c[1], r: BODY.head * 0.52, fill: "#f1f3f4", stroke: "#5f6368", "stroke-width": 2 }, this.svg);
      const head = mul(rot.z(angles.HeadYaw), rot.y(angles.HeadPitch));
      const face = (p) => P(add(centre, apply(head, p), 1));
      const forward = apply(head, [1, 0, 0]);
      if (forward[0] <= 0.05) return; // facing away
      for (const side of [1, -1]) {
        const eye = face([BODY.head * 0.9, side * 17, 10]);
        el("circle", { cx: eye[0], cy: eye[1], r: 4.5, fill: "#202124" }, svg);
      }
      const mouth = [face([BODY.head * 0.92, 14, -18]), face([BODY.head * 0.95, 0, -22]), face([BODY.head * 0.92, -14, -18])];
      el("polyline", { points: mouth.map((p) => p[0] + "," + p[1]).join(" "), fill: "none", stroke: "#5f6368", "stroke-width": 2 }, svg);
    }
  }

  // ---- the page -------------------------------------------------------------------------

  function legend(container, live) {
    const items = OUTCOMES.map(([name, colour]) => ["action " + name, colour]);
    items.push(["gesture", COLOURS.gesture], ["body talk", COLOURS.bodyTalk], ["sound", COLOURS.sound],
      ["stopped here", COLOURS.cut], ["bookmark", COLOURS.bookmark], ["speech held", COLOURS.hold],
      ["memory event", COLOURS.event], ["left arm", "#1a73e8"], ["right arm", "#d93025"]);
    if (!live) items.push(["now", COLOURS.cursor]);
    for (const [label, colour] of items) {
      const span = document.createElement("span");
      const swatch = document.createElement("i");
      swatch.style.background = colour;
      span.appendChild(swatch);
      span.appendChild(document.createTextNode(label));
      container.appendChild(span);
    }
  }

  const viewer = {
    model: null,
    drawnAngles: null,
    drawnUs: null,
    angleAt: (name, us) => angleAt(viewer.model, name, us),
    behaviourNames: () => viewer.model.behaviours.map((b) => b.name),
    errors: [],
    ready: false,
  };
  window.mokutoViewer = viewer;

  function showFigure(figure, model, us) {
    const angles = anglesAt(model, us);
    figure.draw(angles);
    viewer.drawnAngles = figure.drawn;
    viewer.drawnUs = us;
  }

  function startRecorded(data) {
    const model = newModel(data);
    for (const e of data.entries) addEntry(model, e);
    viewer.model = model;
    const audio = document.getElementById("audio");
    const button = document.getElementById("play");
    const clock = document.getElementById("clock");
    const waveform = decodeWav(audio.getAttribute("src"), model.originUs);
    const total = waveform ? waveform.seconds : (model.endUs - model.originUs) / 1e6;
    const endUs = Math.max(model.endUs, model.originUs + total * 1e6);
    const figure = new Figure(document.getElementById("figure"));
    const lanes = new Lanes(document.getElementById("lanes"), (us) => {
      audio.currentTime = Math.max(0, Math.min(total, (us - model.originUs) / 1e6));
      update();
    });
    if (data.summary) {
      document.getElementById("summary").textContent = data.summary.split("\n").map((l) => l.trim()).filter((l) => l).join(" · ");
    }
    const render = () => lanes.render(model, model.originUs, endUs, waveform);
    function update() {
      const us = model.originUs + audio.currentTime * 1e6;
      lanes.moveCursor(us);
      showFigure(figure, model, us);
      clock.textContent = audio.currentTime.toFixed(3) + " s / " + total.toFixed(3) + " s";
    }
    function frame() {
      update();
      if (!audio.paused) requestAnimationFrame(frame);
    }
    button.addEventListener("click", () => (audio.paused ? audio.play() : audio.pause()));
    document.addEventListener("keydown", (event) => {
      if (event.code === "Space" && event.target === document.body) {
        event.preventDefault();
        button.click();
      }
    });
    audio.addEventListener("play", () => {
      button.textContent = "Pause";
      requestAnimationFrame(frame);
    });
    audio.addEventListener("pause", () => {
      button.textContent = "Play";
      update();
    });
    for (const name of ["seeked", "timeupdate", "loadedmetadata"]) audio.addEventListener(name, update);
    window.addEventListener("resize", () => {
      render();
      update();
    });
    render();
    update();
    viewer.ready = true;
  }

  function startLive() {
    const model = newModel({});
    viewer.model = model;
    const figure = new Figure(document.getElementById("figure"));
    const lanes = new Lanes(document.getElementById("lanes"), () => {});
    const clock = document.getElementById("clock");
    const status = document.getElementById("status");
    let serverUs = 0;
    let serverAt = performance.now();
    const nowUs = () => Math.max(model.lastUs, serverUs + (performance.now() - serverAt) * 1000);
    let dirty = true;
    let lastRender = 0;
    const source = new EventSource("events");
    source.addEventListener("hello", (event) => {
      const hello = JSON.parse(event.data);
      model.joints = hello.joints;
      model.sampleUs = hello.sampleUs;
      serverUs = hello.nowUs;
      serverAt = performance.now();
      for (const e of hello.entries) addEntry(model, e);
      status.textContent = "live";
      dirty = true;
      viewer.ready = true;
    });
    source.addEventListener("entry", (event) => {
      addEntry(model, JSON.parse(event.data));
      dirty = true;
    });
    source.onerror = () => {
      status.textContent = "disconnected; retrying…";
    };
    function frame(time) {
      const now = nowUs();
      // The lanes are drawn again five times a second at most; the cursor and the figure
      // follow every frame.
      if ((dirty && time - lastRender > 200) || time - lastRender > 500) {
        const from = Math.max(0, now - LIVE_WINDOW_US);
        lanes.render(model, from, from + LIVE_WINDOW_US + 1e6, null, now);
        lastRender = time;
        dirty = false;
      }
      lanes.moveCursor(now);
      if (model.joints.length) showFigure(figure, model, now);
      clock.textContent = seconds(now, 1) + " s since the robot started";
      requestAnimationFrame(frame);
    }
    requestAnimationFrame(frame);
  }

  window.addEventListener("error", (event) => viewer.errors.push(String(event.message)));
  const live = document.body.classList.contains("live");
  legend(document.getElementById("legend"), live);
  if (live) startLive();
  else startRecorded(JSON.parse(document.getElementById("performance-data").textContent));
})();
