// Shows the digest: first what is seen first, then the rest.

function leftOutInWords(digest) {
  const parts = [];
  const { sessions, glitches, stretches, statistics } = digest.left_out;
  if (sessions) parts.push(counted(sessions, "older session", "older sessions"));
  if (glitches) parts.push(counted(glitches, "older glitch", "older glitches"));
  if (stretches) parts.push(counted(stretches, "older stretch of sound", "older stretches of sound"));
  if (statistics) parts.push(counted(statistics, "older driver statistic", "older driver statistics"));
  return parts.length === 0 ? ""
    : `Sums are of everything. To stay a page, lists leave out: ${parts.join(", ")}. Ask for a shorter time to see them.`;
}

function start() {
  const digest = JSON.parse(document.getElementById("digest").textContent);
  prepareTheme();
  showAnswer(digest);
  const left = leftOutInWords(digest);
  if (left) {
    const place = document.getElementById("left-out");
    place.textContent = left;
    place.hidden = false;
  }
  if (digest.stretches.length + digest.sessions.length + digest.glitches.length > 0) showTimeline(digest);
  if (digest.glitches.length > 0) showSums(digest);
  if (digest.sessions.length > 0) showSessions(digest);
  if (digest.trace !== null) showTrace(digest.trace);
  showTable(digest);
  document.getElementById("version").textContent = digest.version;
  document.documentElement.dataset.ready = "yes";
}

start();
