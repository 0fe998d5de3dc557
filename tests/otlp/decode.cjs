// Reads requests, one a line, and says how many log records came back as they were; else fails.
const assert = require("node:assert");
const root = require("@opentelemetry/otlp-transformer/build/src/generated/root.js");
const Request = root.opentelemetry.proto.collector.logs.v1.ExportLogsServiceRequest;

// A list without elements has no binary form of its own, and comes back as nothing.
function withoutEmptyLists(value) {
    if (Array.isArray(value)) return value.map(withoutEmptyLists);
    if (value === null || typeof value !== "object") return value;
    const kept = Object.entries(value).filter(([, inner]) => !(Array.isArray(inner) && inner.length === 0));
    return Object.fromEntries(kept.map(([key, inner]) => [key, withoutEmptyLists(inner)]));
}

let requests = 0;
let records = 0;
for (const line of require("node:fs").readFileSync(0, "utf8").split("\n").slice(0, -1)) {
    const request = JSON.parse(line);
    const bytes = Request.encode(Request.fromObject(request)).finish();
    const back = Request.toObject(Request.decode(bytes), { longs: String });
    assert.deepStrictEqual(withoutEmptyLists(back), withoutEmptyLists(request));
    ++requests;
    for (const logs of back.resourceLogs.flatMap((resource) => resource.scopeLogs)) records += logs.logRecords.length;
}
assert.ok(records !== 0, "there are no records");
console.log(`${records} log records in ${requests} requests came back as they were`);
