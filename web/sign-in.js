"use strict";

document.getElementById("sign-in-form").addEventListener("submit", async (event) => {
  event.preventDefault();
  const button = event.target.querySelector("button");
  button.disabled = true;
  App.show("");
  try {
    await App.post("/api/sign-in", {
      user: document.getElementById("user-name").value,
      password: document.getElementById("password").value,
    });
    // Only a path of this site: never a link that leads elsewhere.
    const next = new URLSearchParams(location.search).get("next") || "/";
    location.assign(next.startsWith("/") && !next.startsWith("//") ? next : "/");
  } catch (error) {
    App.show(error.message, true);
    document.getElementById("password").select();
  } finally {
    button.disabled = false;
  }
});
