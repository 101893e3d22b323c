// Shared by every page: the API calls (with the session's CSRF token on
// every change), the signed-in user, errors shown to the person, formats.
"use strict";

const App = {
  session: null,

  async call(method, path, body) {
    const options = { method, headers: {}, credentials: "same-origin" };
    if (method === "POST") {
      options.headers["Content-Type"] = "application/json";
      if (App.session) options.headers["X-CSRF-Token"] = App.session.csrf_token;
      options.body = JSON.stringify(body || {});
    }
    let response;
    try {
      response = await fetch(path, options);
    } catch (error) {
      throw new Error("The server does not answer. Check the connection and try again.");
    }
    let answer = null;
    try { answer = await response.json(); } catch (error) { /* not JSON: handled below */ }
    if (response.status === 401 && path !== "/api/sign-in") {
      App.toSignIn();
      throw new Error("Your session has ended. Sign in again.");
    }
    if (!answer || !answer.success) {
      const e = answer && answer.error;
      throw new Error(e ? e.reason + (e.what_to_do ? " — " + e.what_to_do : "") : "The server answered " + response.status);
    }
    return answer.data;
  },
  get(path, params) {
    const query = new URLSearchParams();
    for (const [key, value] of Object.entries(params || {})) {
      if (value !== "" && value !== undefined && value !== null) query.set(key, value);
    }
    const text = query.toString();
    return App.call("GET", text ? path + "?" + text : path);
  },
  post(path, body) { return App.call("POST", path, body); },

  toSignIn() {
    const next = location.pathname + location.search;
    location.assign("/sign-in.html?next=" + encodeURIComponent(next));
  },

  // Loads the session (or goes to the sign-in page) and fills the header.
  async start() {
    App.session = await App.call("GET", "/api/session");
    const user = document.getElementById("user");
    if (user) user.textContent = App.session.user;
    const admin = document.getElementById("admin-link");
    if (admin) admin.hidden = !App.session.admin;
    const out = document.getElementById("sign-out");
    if (out) out.addEventListener("click", async () => {
      try { await App.post("/api/sign-out"); } finally { location.assign("/sign-in.html"); }
    });
    return App.session;
  },

  show(message, isError) {
    const box = document.getElementById("message");
    if (!box) return;
    box.textContent = message || "";
    box.hidden = !message;
    box.classList.toggle("error", !!isError);
  },

  size(bytes) {
    if (bytes === null || bytes === undefined) return "-";
    const units = ["B", "KiB", "MiB", "GiB", "TiB"];
    let value = bytes, unit = 0;
    while (value >= 1024 && unit < units.length - 1) { value /= 1024; unit++; }
    return (unit === 0 ? value : value.toFixed(1)) + " " + units[unit];
  },
  date(seconds) {
    if (!seconds) return "-";
    return new Date(seconds * 1000).toLocaleString([], { dateStyle: "medium", timeStyle: "short" });
  },
  duration(seconds) {
    if (seconds === undefined || seconds === null || seconds < 0) return "-";
    seconds = Math.round(seconds);
    if (seconds < 60) return seconds + " s";
    if (seconds < 3600) return Math.floor(seconds / 60) + " min " + (seconds % 60) + " s";
    return Math.floor(seconds / 3600) + " h " + Math.floor((seconds % 3600) / 60) + " min";
  },
  element(tag, attributes, ...children) {
    const node = document.createElement(tag);
    for (const [key, value] of Object.entries(attributes || {})) {
      if (key === "text") node.textContent = value;
      else if (key.startsWith("on")) node.addEventListener(key.slice(2), value);
      else if (value !== false && value !== null && value !== undefined) node.setAttribute(key, value === true ? "" : value);
    }
    for (const child of children) if (child !== null && child !== undefined) node.append(child);
    return node;
  },
};
