// The administration page: pause and resume, each share's progress (polled
// every two seconds), the indexed folders with their categories, reindex
// and delete, adding a folder through a picker over the shares, and the
// files that could not be indexed.
"use strict";

const byId = (id) => document.getElementById(id);
const CATEGORIES = [["document", "Documents"], ["photo", "Photos"], ["audio", "Music"], ["video", "Videos"]];
let pickerAt = "/";

async function act(work, done) {
  App.show("");
  try {
    await work();
    if (done) App.show(done);
    await refresh();
  } catch (error) {
    App.show(error.message, true);
  }
}

function pauseText(resumeTime) {
  if (resumeTime === 0) return "Paused until resumed.";
  if (resumeTime > Date.now() / 1000) return "Paused until " + App.date(resumeTime) + ".";
  return "Running.";
}

function cell(label, ...children) { return App.element("td", { "data-label": label }, ...children); }

function shareRow(name, entry) {
  const busy = entry.state === "indexing";
  const todo = entry.todo || 0, done = entry.done || 0;
  const bar = busy && todo > 0
    ? App.element("progress", { max: String(todo), value: String(done), "aria-label": name + " progress", text: done + "/" + todo })
    : null;
  return App.element("tr", {},
    cell("Share", name),
    cell("State", entry.state),
    cell("Progress", bar, busy ? " " + done + "/" + todo : "-"),
    cell("Time left", busy ? App.duration(entry.eta_seconds) : "-"),
    cell("Documents", entry.documents === null || entry.documents === undefined ? "-" : String(entry.documents)),
    cell("Index size", App.size(entry.index_bytes)),
    cell("Failed", String(entry.total_failed || 0)));
}

function folderRow(folder) {
  const status = (folder.additional && folder.additional.status) || {};
  const boxes = CATEGORIES.map(([key, label]) => {
    const box = App.element("input", { type: "checkbox", "aria-label": label + " in " + folder.path, checked: !!folder[key] });
    box.addEventListener("change", () => act(() => App.post("/api/folders/set", { path: folder.path, [key]: box.checked }),
      label + (box.checked ? " now indexed in " : " no longer indexed in ") + folder.path));
    return cell(label, box);
  });
  const reindex = App.element("button", { type: "button", class: "plain", text: "Reindex",
    onclick: () => act(() => App.post("/api/folders/reindex", { paths: [folder.path] }), "Reindexing " + folder.path) });
  const remove = App.element("button", { type: "button", class: "danger", text: "Delete",
    onclick: () => {
      if (confirm("Stop indexing " + folder.path + " and remove its documents from the index? The files stay.")) {
        act(() => App.post("/api/folders/delete", { paths: [folder.path] }), "Deleted " + folder.path + " from the index");
      }
    } });
  return App.element("tr", {},
    cell("Folder", App.element("strong", { text: folder.name }), App.element("br"), folder.path),
    cell("Status", App.element("span", { class: "state-" + status.text, text: status.text || "-" }),
      status.desc ? " (" + status.desc + ")" : ""),
    ...boxes,
    cell("Actions", reindex, " ", remove));
}

async function refresh() {
  const [status, folders, failures] = await Promise.all([
    App.get("/api/status"), App.get("/api/folders"), App.get("/api/failures")]);
  byId("pause-state").textContent = pauseText(status.resume_time) +
    (status.daemon_running ? "" : " The indexing daemon is not running: " + (status.daemon_error || ""));
  byId("shares").replaceChildren(...Object.entries(status.shares).map(([name, entry]) => shareRow(name, entry)));
  byId("folders").replaceChildren(...folders.folder.map(folderRow));
  byId("folder-count").textContent = folders.total + " folder(s)";
  const failed = [];
  for (const [share, entry] of Object.entries(failures)) {
    for (const file of entry.files) failed.push(App.element("li", { text: file.path + " — " + file.reason }));
    if (entry.total_failed > entry.files.length) failed.push(App.element("li", { text: share + ": " + entry.total_failed + " failure(s) since fileindexd started" }));
  }
  byId("failed").replaceChildren(...(failed.length ? failed : [App.element("li", { text: "None." })]));
}

async function showPicker(path) {
  try {
    const folders = await App.get("/api/browse", { path });
    pickerAt = path;
    byId("picker-at").textContent = path;
    byId("picker-up").disabled = path === "/";
    byId("picker").replaceChildren(...folders.map((folder) => App.element("li", {},
      App.element("button", { type: "button", class: "plain", text: folder.slice(folder.lastIndexOf("/") + 1) + "/",
        onclick: () => { byId("add-path").value = folder; showPicker(folder); } }))));
    if (!folders.length) byId("picker").replaceChildren(App.element("li", { text: "No folders inside." }));
    byId("picker-box").hidden = false;
  } catch (error) {
    App.show(error.message, true);
  }
}

async function init() {
  const session = await App.start();
  if (!session.admin) {
    App.show("Only administrators may manage indexing.", true);
    return;
  }
  byId("pause").addEventListener("click", () => {
    const hours = parseInt(byId("pause-hours").value, 10);
    act(() => App.post("/api/pause", { hours }), "Indexing paused for " + hours + " hour(s)");
  });
  byId("pause-forever").addEventListener("click", () => act(() => App.post("/api/pause", { hours: 0 }), "Indexing paused until resumed"));
  byId("resume").addEventListener("click", () => act(() => App.post("/api/resume"), "Indexing resumed"));
  byId("browse").addEventListener("click", () => showPicker(byId("add-path").value.startsWith("/") ? byId("add-path").value : "/"));
  byId("picker-up").addEventListener("click", () => {
    const up = pickerAt.slice(0, pickerAt.lastIndexOf("/"));
    showPicker(up === "" ? "/" : up);
  });
  byId("add-form").addEventListener("submit", (event) => {
    event.preventDefault();
    const path = byId("add-path").value.trim().replace(/\/+$/, "");
    const body = { path };
    if (byId("add-name").value.trim()) body.name = byId("add-name").value.trim();
    for (const [key] of CATEGORIES) body[key] = byId("add-" + key).checked;
    act(async () => {
      await App.post("/api/folders/add", body);
      byId("picker-box").hidden = true;
    }, "Added " + path + "; indexing starts now");
  });
  await refresh();
  setInterval(() => refresh().catch((error) => App.show(error.message, true)), 2000);
}

init().catch((error) => App.show(error.message, true));
