// The answer in words, and the numbers beside it.

// The one that leads: more glitches than any other. Null when none does.
function leading(sums) {
  const [first, second] = [...sums].sort((one, other) => other.glitches - one.glitches);
  return !first || first.others || first.glitches === second?.glitches ? null : first;
}

function soundInWords(digest) {
  const { played_seconds: played, captured_seconds: captured } = digest.totals;
  const parts = [];
  if (played > 0) parts.push(`${lengthOf(played)} were played`);
  if (captured > 0) parts.push(`${lengthOf(captured)} ${played > 0 ? "" : "were "}captured`);
  return parts.join(" and ");
}

function whoInWords(digest) {
  const busy = digest.applications.filter((of) => of.played_seconds + of.captured_seconds > 0);
  if (busy.length === 0) return [];
  const most = busy[0];
  const length = lengthOf(most.played_seconds + most.captured_seconds);
  const way = most.played_seconds > 0 ? "came from " : "went to ";
  if (busy.length === 1) return [` All of it ${way}`, name(applicationName(most)), "."];
  const all = digest.totals.played_seconds + digest.totals.captured_seconds;
  const most_of_all = most.played_seconds + most.captured_seconds > all / 2;
  return [` Of ${counted(busy.length, "application", "applications")}, `, name(applicationName(most)),
    most_of_all ? ` had most of it (${length}).` : ` had the largest part (${length}).`];
}

function soundSentence(digest) {
  const { sessions, messages } = digest.totals;
  const sound = soundInWords(digest);
  if (sound) {
    return [`In ${counted(sessions, "session", "sessions")}, ${sound}.`, ...whoInWords(digest)];
  }
  if (sessions > 0) {
    return [`There ${sessions === 1 ? "was" : "were"} ${counted(sessions, "session", "sessions")}, ` +
      "but nothing says that sound was played or captured."];
  }
  return [messages > 0
    ? `Nothing was played or captured; ${counted(messages, "message", "messages")} came without a session.`
    : "Nothing was played or captured, and nothing was reported."];
}

function rateInWords(totals) {
  const rate = totals.glitches_per_hour;
  const hours = (totals.played_seconds + totals.captured_seconds) / 3600;
  if (rate === null) return "";
  const value = rate < 10 ? rate.toFixed(1) : whole(Math.round(rate));
  // Of a few minutes no hour can be told.
  return hours < 0.25 ? `, at a rate of ${value} an hour` : `, ${value} an hour of sound`;
}

function glitchSentence(digest) {
  const { glitches, silent_seconds: silent, longest_seconds: longest } = digest.totals;
  if (glitches === 0) {
    return [soundInWords(digest) ? "No glitch was reported." : "There are no glitches."];
  }
  const [application, cause] = [leading(digest.by_application), leading(digest.by_cause)];
  const said = [`Sound was missing ${glitches === 1 ? "once" : glitches === 2 ? "twice" : `${whole(glitches)} times`}` +
    `${rateInWords(digest.totals)}, for ${lengthOf(silent)} in all` +
    (glitches > 1 ? ` and ${lengthOf(longest)} at the longest.` : ".")];
  return [...said, ...leaderInWords(application, digest), ...causeOfMost(cause, digest)];
}

function leaderInWords(application, { totals: { glitches }, by_application: all }) {
  if (!application) return [` No application leads, of ${whole(all.length)}.`];
  return [" ", name(nameOr(application.name, "An application without a name")),
    application.glitches < glitches ? ` had the most (${whole(application.glitches)}).`
      : glitches === 1 ? " had it." : " had them all."];
}

function causeOfMost(cause, { totals: { glitches }, by_cause: all }) {
  if (!cause) return [` No cause leads: ${all.slice(0, 3).map((one) => causeInWords(one.name)).join("; ")}.`];
  return [cause.glitches === glitches ? ` The cause: ${causeInWords(cause.name)}.`
    : ` The leading cause: ${causeInWords(cause.name)} (${whole(cause.glitches)}).`];
}

function scopeInWords(digest) {
  const parts = [];
  const times = digest.sessions.flatMap((s) => [s.opened, s.closed ?? s.last_heard]).filter((t) => t !== null);
  if (digest.since !== null || digest.until !== null) {
    parts.push(digest.since === null ? `until ${dayAndTime(digest.until)}`
      : span(digest.since, digest.until ?? digest.made));
  } else if (times.length > 0) {
    parts.push(span(d3.min(times), d3.max(times)));
  }
  if (digest.application !== null) parts.push(`applications like “${plain(digest.application)}”`);
  parts.push(`made ${dayAndTime(digest.made)}`);
  return parts.join(" · ");
}

function figure(value, what) {
  return element("div", { class: "figure" }, element("dd", {}, value), element("dt", {}, what));
}

function showAnswer(digest) {
  const totals = digest.totals;
  document.getElementById("scope").textContent = scopeInWords(digest);
  document.getElementById("answer").append(
    element("p", {}, ...soundSentence(digest)), element("p", {}, ...glitchSentence(digest)));
  if (totals.sessions + totals.messages + totals.glitches === 0) return;
  const rate = totals.glitches_per_hour;
  const { played_seconds: played, captured_seconds: captured } = totals;
  document.getElementById("figures").append(
    ...(played > 0 || captured === 0 ? [figure(lengthOf(played), "played")] : []),
    ...(captured > 0 ? [figure(lengthOf(captured), "captured")] : []),
    figure(whole(totals.sessions), totals.sessions === 1 ? "session" : "sessions"),
    figure(whole(totals.glitches), totals.glitches === 1 ? "glitch" : "glitches"),
    figure(rate === null ? "–" : rate < 10 ? rate.toFixed(1) : whole(Math.round(rate)), "glitches an hour"),
    figure(lengthOf(totals.silent_seconds), "silent"));
}
