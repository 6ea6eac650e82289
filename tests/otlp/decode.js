// usage: node decode.js NODE-MODULES [logs|metrics|traces FILE]...
// Prints the request in each FILE, decoded by the OpenTelemetry project's own generated
// code, as one line of JSON: 64-bit numbers as texts, bytes in hexadecimal.
"use strict";
const fs = require("fs");
const path = require("path");

const [modules, ...requests] = process.argv.slice(2);
const root = require(path.resolve(
  modules, "@opentelemetry/otlp-transformer/build/src/generated/root"));
const { logs, metrics, trace } = root.opentelemetry.proto.collector;
const DECODERS = {
  logs: logs.v1.ExportLogsServiceRequest,
  metrics: metrics.v1.ExportMetricsServiceRequest,
  traces: trace.v1.ExportTraceServiceRequest,
};

function plain(value) {
  if (value === null || typeof value !== "object") return value;
  if (value instanceof Uint8Array) return Buffer.from(value).toString("hex");
  if (Array.isArray(value)) return value.map(plain);
  if (typeof value.low === "number" && typeof value.high === "number") return value.toString();
  return Object.fromEntries(Object.entries(value).map(([key, each]) => [key, plain(each)]));
}

for (let i = 0; i < requests.length; i += 2) {
  const decoded = DECODERS[requests[i]].decode(fs.readFileSync(requests[i + 1]));
  console.log(JSON.stringify(plain(decoded)));
}
