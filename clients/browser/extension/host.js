// The connection to the native host, which has one to the daemon.

const NAME = "com.quorvane.tavrin";
const IDLE = 5 * 60 * 1000; // milliseconds without a message after which the host's process is not kept

/**
 * Asks the native host. The browser starts it with the first message; it is started again when it has ended.
 */
export class Host {
  #runtime;
  #port = null;
  #pending = new Map(); // by id
  #id = 0;
  #idle = 0;

  /** `runtime` is the browser's. */
  constructor(runtime) {
    this.#runtime = runtime;
  }

  /** Returns the answer to a message. Rejects with an Error, whose message is for the user. */
  ask(message) {
    clearTimeout(this.#idle);
    this.#idle = setTimeout(() => this.#rest(), IDLE);
    return new Promise((resolve, reject) => {
      const id = ++this.#id;
      this.#pending.set(id, { resolve, reject });
      try {
        (this.#port ??= this.#connect()).postMessage({ id, ...message });
      } catch (problem) {
        this.#ended(problem.message);
      }
    });
  }

  /** Sends a report, whose failure doesn't matter. */
  tell(message) {
    this.ask(message).catch(() => {});
  }

  #connect() {
    const port = this.#runtime.connectNative(NAME);
    port.onMessage.addListener((answer) => {
      const asked = this.#pending.get(answer.id);
      this.#pending.delete(answer.id);
      if (answer.error) asked?.reject(new Error(answer.error.message));
      else asked?.resolve(answer);
    });
    port.onDisconnect.addListener(() => {
      const problem = (port.error ?? this.#runtime.lastError)?.message;
      if (port === this.#port) this.#ended(problem ?? "it ended.");
    });
    return port;
  }

  #rest() {
    this.#port?.disconnect(); // which the listener is not told
    this.#ended("it was idle.");
  }

  #ended(problem) {
    this.#port = null;
    for (const { reject } of this.#pending.values())
      reject(new Error(`The native host of Tavrin Search failed: ${problem} Is the package tavrin-clients installed?`));
    this.#pending.clear();
  }
}
