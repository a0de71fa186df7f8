// The pages in a real browser: Debian's Chromium, headless, driven over the DevTools
// protocol (chrome-remote-interface, installed by scripts/setup). Two scenarios:
//
//   node browser_test.js viewer MOKUTO ARTEFACTS
//     `mokuto say --html` of the README's example: the page loads with no console error,
//     its audio lasts as long as the WAV, and at three seek times the figure is drawn
//     from the sampled joint angles.
//   node browser_test.js live ZEFOKO MODULE ARTEFACTS
//     `zefoko serve --http` with the service: a click on a link of its tag page runs the
//     behaviour (on the robot's timeline and on the live page), and calls that are not
//     one literal call are refused with 400, the robot doing nothing.
//
// Screenshots go to ARTEFACTS. Exit status 0 when every check passed, 77 when Chromium
// or the driver is missing outside CI (the test is skipped), 1 otherwise.
"use strict";

const childProcess = require("child_process");
const fs = require("fs");
const http = require("http");
const os = require("os");
const path = require("path");

const SKIP = 77;
const BOUND_MS = 30000;
const CHROMIUM = process.env.CHROMIUM || "/usr/bin/chromium";
const README_TEXT =
  "Hello ^start(animations/Stand/Gestures/Hey_1) my friend, ^wait(animations/Stand/Gestures/Hey_1) " +
  "how are you today? ^runSound(bells/ding, 50) $greeted=1 See you soon!";

let CDP;
try {
  CDP = require("chrome-remote-interface");
} catch (e) {
  missing("the browser tests' driver (chrome-remote-interface): run scripts/setup");
}
if (!fs.existsSync(CHROMIUM)) missing(CHROMIUM + ": run scripts/setup");

function missing(what) {
  console.error("browser test: no " + what);
  process.exit(process.env.CI ? 1 : SKIP);
}

let failures = 0;
function check(ok, what, detail) {
  console.log((ok ? "ok    " : "FAIL  ") + what + (detail ? ": " + detail : ""));
  if (!ok) failures++;
}

// Resolves with the value of `promise`, or rejects after `ms` naming `what`.
function bounded(promise, what, ms = BOUND_MS) {
  let timer;
  const timeout = new Promise((_, reject) => {
    timer = setTimeout(() => reject(new Error("no " + what + " within " + ms / 1000 + " s")), ms);
  });
  return Promise.race([promise, timeout]).finally(() => clearTimeout(timer));
}

// Resolves with the first match of `pattern` in what the process writes on `stream`.
function waitForOutput(child, stream, pattern, what) {
  return bounded(
    new Promise((resolve, reject) => {
      let text = "";
      child[stream].on("data", (chunk) => {
        text += chunk;
        const match = pattern.exec(text);
        if (match) resolve(match);
      });
      child.on("exit", (code) => reject(new Error(what + ": the process ended (" + code + ")\n" + text)));
    }),
    what
  );
}

function run(command, args) {
  const result = childProcess.spawnSync(command, args, { encoding: "utf8", timeout: 120000 });
  if (result.status !== 0) throw new Error(command + " " + args.join(" ") + " failed:\n" + result.stdout + result.stderr);
  return result.stdout;
}

// ---- Chromium ----------------------------------------------------------------------------

async function launchChromium() {
  const profile = fs.mkdtempSync(path.join(os.tmpdir(), "zefoko-chromium-"));
  const child = childProcess.spawn(CHROMIUM, [
    "--headless", "--no-sandbox", "--disable-gpu", "--disable-quic", "--no-first-run",
    "--disable-background-networking", "--disable-component-update", "--disable-sync",
    "--mute-audio", "--user-data-dir=" + profile, "--remote-debugging-port=0",
    "--window-size=1400,1000", "about:blank",
  ], { stdio: ["ignore", "ignore", "pipe"], detached: true });
  const match = await waitForOutput(child, "stderr", /DevTools listening on ws:\/\/[^:]+:(\d+)\//, "Chromium's DevTools port");
  return {
    port: Number(match[1]),
    // Chromium and the processes it started (its own process group), then its profile.
    async close() {
      const exited = new Promise((resolve) => (child.exitCode !== null ? resolve() : child.on("exit", resolve)));
      try {
        process.kill(-child.pid, "SIGKILL");
      } catch (e) {
        // already gone
      }
      await bounded(exited, "the end of Chromium");
      try {
        fs.rmSync(profile, { recursive: true, force: true, maxRetries: 5, retryDelay: 100 });
      } catch (e) {
        console.log("note: " + profile + " left behind: " + e.message);
      }
    },
  };
}

// A tab, with its console errors and exceptions collected.
async function openTab(browser, url) {
  const target = await CDP.New({ port: browser.port, url: "about:blank" });
  const client = await CDP({ port: browser.port, target: target });
  const errors = [];
  client.Runtime.consoleAPICalled((event) => {
    if (event.type === "error" || event.type === "assert")
      errors.push(event.args.map((a) => a.value || a.description).join(" "));
  });
  client.Runtime.exceptionThrown((event) => errors.push(event.exceptionDetails.text + " " + JSON.stringify(event.exceptionDetails.exception || {})));
  client.Log.entryAdded(({ entry }) => {
    if (entry.level === "error") errors.push(entry.text + " " + (entry.url || ""));
  });
  await Promise.all([client.Runtime.enable(), client.Log.enable(), client.Page.enable()]);
  await client.Emulation.setDeviceMetricsOverride({ width: 1400, height: 1000, deviceScaleFactor: 1, mobile: false });
  const loaded = client.Page.loadEventFired();
  await client.Page.navigate({ url: url });
  await bounded(loaded, "load of " + url);
  return { client: client, errors: errors };
}

// The value of an expression in the page; a promise is awaited.
async function evaluate(tab, expression, what) {
  const { result, exceptionDetails } = await bounded(
    tab.client.Runtime.evaluate({ expression: expression, awaitPromise: true, returnByValue: true }),
    what || expression
  );
  if (exceptionDetails) throw new Error((what || expression) + ": " + JSON.stringify(exceptionDetails));
  return result.value;
}

// Resolves in the page once `condition` (an expression) is true, checked at each frame.
function untilInPage(tab, condition, what) {
  return evaluate(tab, "new Promise((resolve) => { const check = () => (" + condition +
    ") ? resolve(true) : setTimeout(check, 20); check(); })", what);
}

async function screenshot(tab, file) {
  const { data } = await tab.client.Page.captureScreenshot({ format: "png" });
  fs.writeFileSync(file, Buffer.from(data, "base64"));
  console.log("screenshot " + file);
}

// ---- the recorded performance -------------------------------------------------------------

function readJsonLines(file) {
  return fs.readFileSync(file, "utf8").split("\n").filter((l) => l).map((l) => JSON.parse(l));
}

function wavSeconds(file) {
  const bytes = fs.readFileSync(file);
  let at = 12;
  let rate = 0;
  let blockAlign = 0;
  while (at + 8 <= bytes.length) {
    const id = bytes.toString("ascii", at, at + 4);
    const size = bytes.readUInt32LE(at + 4);
    if (id === "fmt ") {
      rate = bytes.readUInt32LE(at + 12);
      blockAlign = bytes.readUInt16LE(at + 20);
    }
    if (id === "data") return size / blockAlign / rate;
    at += 8 + size + (size % 2);
  }
  throw new Error(file + ": no data chunk");
}

// The sampled angle of a joint at `us`, as the timeline's "angles" entries tell it: the
// last sample, moving in a straight line to the next over the sampling period before it.
function sampledAngle(samples, us, sampleUs) {
  if (samples.length === 0) return undefined;
  if (us < samples[0][0]) return samples[0][1];
  let k = 0;
  while (k + 1 < samples.length && samples[k + 1][0] <= us) k++;
  const [t0, a0] = samples[k];
  if (k + 1 === samples.length) return a0;
  const [t1, a1] = samples[k + 1];
  const from = Math.max(t0, t1 - sampleUs);
  return us <= from ? a0 : a0 + ((a1 - a0) * (us - from)) / (t1 - from);
}

async function viewerScenario(mokuto, artefacts) {
  const work = fs.mkdtempSync(path.join(os.tmpdir(), "zefoko-viewer-"));
  const files = { html: path.join(work, "say.html"), wav: path.join(work, "say.wav"), timeline: path.join(work, "say.jsonl") };
  run(mokuto, ["say", "--quiet", "--html", files.html, "--wav", files.wav, "--timeline", files.timeline, README_TEXT]);
  const entries = readJsonLines(files.timeline);
  const samples = new Map();
  for (const e of entries) {
    if (e.service !== "ZUMotion" || e.operation !== "angles") continue;
    for (const [joint, angle] of Object.entries(e.arguments)) {
      if (!samples.has(joint)) samples.set(joint, []);
      samples.get(joint).push([e.us, angle]);
    }
  }
  check(samples.size === 14, "the timeline samples the pose of the 14 joints", String(samples.size));

  const browser = await launchChromium();
  try {
    const tab = await openTab(browser, "file://" + files.html);
    await untilInPage(tab, "window.mokutoViewer && window.mokutoViewer.ready", "the viewer ready");
    const duration = await evaluate(tab, "new Promise((resolve) => { const a = document.getElementById('audio'); " +
      "if (a.readyState >= 1) resolve(a.duration); else a.addEventListener('loadedmetadata', () => resolve(a.duration)); })");
    const seconds = wavSeconds(files.wav);
    check(Math.abs(duration - seconds) < 0.001, "the audio element lasts as long as the WAV", duration + " s, WAV " + seconds + " s");

    const data = JSON.parse(await evaluate(tab, "document.getElementById('performance-data').textContent"));
    const rest = Object.fromEntries(data.joints.map((j) => [j.name, j.rest]));
    for (const t of [1.2, 2.4, 5.6]) {
      const drawn = await evaluate(tab, "new Promise((resolve) => { const a = document.getElementById('audio'); " +
        "a.addEventListener('seeked', () => resolve({ t: a.currentTime, us: window.mokutoViewer.drawnUs, " +
        "angles: window.mokutoViewer.drawnAngles }), { once: true }); a.currentTime = " + t + "; })", "a seek to " + t + " s");
      check(Math.abs(drawn.us - (data.originUs + drawn.t * 1e6)) < 1, "at " + t + " s the figure is drawn for that time", drawn.us + " us");
      let worst = 0;
      let moved = 0;
      for (const [joint, series] of samples) {
        const expected = sampledAngle(series, drawn.us, data.sampleUs);
        worst = Math.max(worst, Math.abs(drawn.angles[joint] - expected));
        if (Math.abs(expected - rest[joint]) > 0.05) moved++;
      }
      check(worst < 1e-9, "at " + t + " s the drawn angles are the sampled ones", "largest difference " + worst + " rad, " + moved + " joints away from rest");
      check(moved > 0, "at " + t + " s the robot is not at rest");
    }
    await evaluate(tab, "new Promise((resolve) => { const a = document.getElementById('audio'); a.addEventListener('seeked', resolve, { once: true }); a.currentTime = 2.0; })");
    await screenshot(tab, path.join(artefacts, "viewer.png"));
    check(tab.errors.length === 0, "the viewer logs no console error", tab.errors.join(" | "));
    await tab.client.close();
  } finally {
    await browser.close();
    fs.rmSync(work, { recursive: true, force: true });
  }
}

// ---- the served pages ----------------------------------------------------------------------

function get(url) {
  return bounded(
    new Promise((resolve, reject) => {
      http.get(url, (res) => {
        let body = "";
        res.setEncoding("utf8");
        res.on("data", (chunk) => (body += chunk));
        res.on("end", () => resolve({ status: res.statusCode, body: body }));
      }).on("error", reject);
    }),
    "an answer from " + url
  );
}

async function timelineOf(base) {
  return (await get(base + "timeline")).body.split("\n").filter((l) => l).map((l) => JSON.parse(l));
}

async function liveScenario(zefoko, module, artefacts) {
  // Listening for other processes too: the pages and they share the robot.
  const server = childProcess.spawn(zefoko, ["serve", "--speech", "timing", "--listen", "tcp://127.0.0.1:*", "--http", "127.0.0.1:0", module], { stdio: ["ignore", "pipe", "pipe"] });
  let serverErrors = "";
  server.stderr.on("data", (chunk) => (serverErrors += chunk));
  const browser = await launchChromium();
  try {
    const base = (await waitForOutput(server, "stdout", /pages at (http:\/\/\S+\/)/, "the address of zefoko serve"))[1];
    const index = await get(base);
    check(index.status === 200 && index.body.includes('href="/ZUMokuto/"'), "the index links the service's page");

    const live = await openTab(browser, base + "live/");
    await untilInPage(live, "window.mokutoViewer && window.mokutoViewer.ready", "the live page's first event");

    const page = await openTab(browser, base + "ZUMokuto/");
    const link = await evaluate(page, "(() => { const links = [...document.querySelectorAll('a[href^=\"javascript:runBehavior\"]')]; " +
      "const a = links.find((l) => l.textContent.includes('/Stand/Gestures/')) || links[0]; if (!a) return null; a.scrollIntoView(); " +
      "const box = a.getBoundingClientRect(); return { name: a.textContent, x: box.x + box.width / 2, y: box.y + box.height / 2 }; })()");
    check(link !== null, "the tag page has links that run behaviours");
    if (link === null) return;
    for (const type of ["mousePressed", "mouseReleased"])
      await page.client.Input.dispatchMouseEvent({ type: type, x: link.x, y: link.y, button: "left", clickCount: 1 });
    await untilInPage(live, "window.mokutoViewer.behaviourNames().includes(" + JSON.stringify(link.name) + ")", "the behaviour on the live page");
    const started = (await timelineOf(base)).some((e) => e.service === "ZUBehaviorManager" && e.operation === "startBehavior" && e.arguments[0] === link.name);
    check(started, "a click on " + link.name + " runs it on the robot (its timeline)");
    check(true, "the live page shows " + link.name);
    await untilInPage(live, "window.mokutoViewer.model.behaviours.every((b) => b.endUs !== null)", "the behaviour's end on the live page");
    const said = await get(base + "ZUMokuto/?eval=" + encodeURIComponent("ZUMokuto.say('Hi ^start(animations/Stand/Gestures/Hey_1) there')"));
    check(said.status === 200 || said.status === 202, "a text said through a page's call", said.status + " " + said.body);
    await untilInPage(live, "window.mokutoViewer.model.actions.some((a) => a.text.includes('Hey_1') && a.outcome === 'executed')", "the text's action on the live page");
    await screenshot(live, path.join(artefacts, "live.png"));

    const before = (await timelineOf(base)).filter((e) => !(e.service === "ZUMotion" && e.operation === "angles")).length;
    const refused = [
      "ZUBehaviorManager.runBehavior(animations/Stand/Gestures/Hey_1)",
      "ZUBehaviorManager.runBehavior('" + link.name + "'); ZUMotion.stop(1)",
      "ZUBehaviorManager['runBehavior']('" + link.name + "')",
      "ZUBehaviorManager.runBehavior(name)",
      "ZUBehaviorManager.runBehavior('" + link.name + "'",
      "",
      "ZUNoSuchService.run()",
      "ZUBehaviorManager.noSuchMethod('x')",
    ];
    for (const call of refused) {
      const answer = await get(base + "ZUMokuto/?eval=" + encodeURIComponent(call));
      check(answer.status === 400 && JSON.parse(answer.body).error.length > 0, "refused with 400: " + call, answer.status + " " + answer.body);
    }
    const after = (await timelineOf(base)).filter((e) => !(e.service === "ZUMotion" && e.operation === "angles")).length;
    check(after === before, "the robot did nothing for the refused calls", before + " entries, then " + after);
    check(page.errors.length === 0 && live.errors.length === 0, "the pages log no console error", page.errors.concat(live.errors).join(" | "));
  } finally {
    server.kill("SIGTERM");
    await browser.close();
    await bounded(new Promise((resolve) => (server.exitCode !== null ? resolve() : server.on("exit", resolve))), "the end of zefoko serve");
    const stopped = server.exitCode === 0;
    check(stopped, "zefoko serve stops on SIGTERM", stopped ? "" : server.exitCode + "\n" + serverErrors);
  }
}

async function main() {
  const [scenario, ...args] = process.argv.slice(2);
  const artefacts = args[args.length - 1];
  fs.mkdirSync(artefacts, { recursive: true });
  if (scenario === "viewer") await viewerScenario(args[0], artefacts);
  else if (scenario === "live") await liveScenario(args[0], args[1], artefacts);
  else throw new Error("usage: browser_test.js viewer MOKUTO ARTEFACTS | live ZEFOKO MODULE ARTEFACTS");
  console.log((failures === 0 ? "passed" : failures + " checks failed"));
  process.exit(failures === 0 ? 0 : 1);
}

main().catch((error) => {
  console.error(error.stack || String(error));
  process.exit(1);
});
