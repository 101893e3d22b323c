// The search page: suggestions while typing, results with their highlighted
// passage, filters, paging, download links. The search is in the address
// (?q=...&from=...) so back and reload keep it.
"use strict";

const PAGE_SIZE = 20;
const byId = (id) => document.getElementById(id);
let from = 0;
let suggestTimer = 0;

function filters() {
  const day = (id, end) => {
    const value = byId(id).value;
    if (!value) return "";
    return Math.floor(new Date(value + (end ? "T23:59:59" : "T00:00:00")).getTime() / 1000);
  };
  const megabytes = (id) => (byId(id).value === "" ? "" : Math.round(parseFloat(byId(id).value) * 1048576));
  return {
    q: byId("q").value.trim(),
    share: byId("share").value,
    category: byId("category").value,
    modified_from: day("modified-from", false),
    modified_to: day("modified-to", true),
    size_min: megabytes("size-min"),
    size_max: megabytes("size-max"),
  };
}

function snippet(pieces) {
  const paragraph = App.element("p", { class: "snippet" });
  for (const piece of pieces) paragraph.append(piece.match ? App.element("mark", { text: piece.text }) : piece.text);
  return paragraph;
}

function hitItem(hit) {
  const title = hit.is_dir
    ? App.element("span", { class: "name", text: hit.name + "/" })
    : App.element("a", { class: "name", href: "/api/download?path=" + encodeURIComponent(hit.path), download: hit.name, text: hit.name });
  const facts = App.element("p", { class: "facts" },
    App.element("span", { class: "folder", text: hit.folder }),
    App.element("span", { text: hit.is_dir ? "folder" : App.size(hit.size) }),
    App.element("time", { datetime: new Date(hit.modified * 1000).toISOString(), text: App.date(hit.modified) }));
  return App.element("li", {}, title, facts, hit.highlight ? snippet(hit.highlight) : null);
}

async function search(pushState) {
  const asked = filters();
  App.show("");
  byId("summary").textContent = "Searching…";
  if (pushState) history.pushState(null, "", "?" + new URLSearchParams({ q: asked.q, from: String(from) }));
  try {
    const result = await App.get("/api/search", { ...asked, from, size: PAGE_SIZE });
    const list = byId("results");
    list.replaceChildren(...result.hits.map(hitItem));
    list.start = from + 1;
    const total = result.total;
    const more = result.total_exact ? "" : "+";
    byId("summary").textContent = total === 0 ? "Nothing found." : total + more + " found";
    byId("pager").hidden = total <= PAGE_SIZE && from === 0;
    byId("previous").disabled = from === 0;
    byId("next").disabled = from + result.hits.length >= total;
    byId("page-info").textContent = result.hits.length ? (from + 1) + "–" + (from + result.hits.length) + " of " + total + more : "";
  } catch (error) {
    byId("summary").textContent = "";
    App.show(error.message, true);
  }
}

async function suggest() {
  const text = byId("q").value.trim().split(/\s+/).pop();
  if (!text || text.length < 2 || text.includes(":")) return;
  try {
    const words = await App.get("/api/suggest", { q: text, share: byId("share").value });
    const prefix = byId("q").value.replace(/\S*$/, "");
    byId("suggestions").replaceChildren(...words.map((word) => App.element("option", { value: prefix + word })));
  } catch (error) { /* suggestions are a help only */ }
}

async function init() {
  await App.start();
  const shares = await App.get("/api/shares");
  for (const share of shares) byId("share").append(App.element("option", { value: share, text: share }));
  const params = new URLSearchParams(location.search);
  byId("q").value = params.get("q") || "";
  from = parseInt(params.get("from") || "0", 10) || 0;
  byId("search-form").addEventListener("submit", (event) => { event.preventDefault(); from = 0; search(true); });
  byId("q").addEventListener("input", () => { clearTimeout(suggestTimer); suggestTimer = setTimeout(suggest, 150); });
  byId("previous").addEventListener("click", () => { from = Math.max(0, from - PAGE_SIZE); search(true); });
  byId("next").addEventListener("click", () => { from += PAGE_SIZE; search(true); });
  window.addEventListener("popstate", () => {
    const state = new URLSearchParams(location.search);
    byId("q").value = state.get("q") || "";
    from = parseInt(state.get("from") || "0", 10) || 0;
    search(false);
  });
  if (params.has("q")) search(false);
}

init().catch((error) => App.show(error.message, true));
