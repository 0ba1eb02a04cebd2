// Calls the service's control end points. Failures are errors with the service's text.

async function call(path, options) {
  const reply = await fetch(`/control/${path}`, options).catch(() => {
    throw new Error("the service doesn't answer");
  });
  const answer = await reply.json().catch(() => ({ error: `an answer of status ${reply.status} without JSON` }));
  if (!reply.ok || answer?.error !== undefined && !("number" in answer)) throw new Error(answer.error ?? `status ${reply.status}`);
  return answer;
}

export const get = (path) => call(path, {});

/** `body` is an object, or a JSON text that the service shall read. */
export const post = (path, body = {}) => call(path, {
  method: "POST",
  headers: { "Content-Type": "application/json" },
  body: typeof body === "string" ? body : JSON.stringify(body),
});
