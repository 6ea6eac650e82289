// Light or dark: as the system has it, until somebody chooses.

function showTheme(button, theme) {
  if (theme) document.documentElement.dataset.theme = theme;
  button.textContent = isDark() ? "Light" : "Dark";
  button.setAttribute("aria-label", `Show the page ${isDark() ? "light" : "dark"}`);
}

function isDark() {
  const chosen = document.documentElement.dataset.theme;
  return chosen ? chosen === "dark" : matchMedia("(prefers-color-scheme: dark)").matches;
}

function prepareTheme() {
  const button = document.getElementById("theme");
  showTheme(button, null);
  button.addEventListener("click", () => showTheme(button, isDark() ? "light" : "dark"));
  matchMedia("(prefers-color-scheme: dark)").addEventListener("change", () => showTheme(button, null));
}
