// The colour of each device, the same in all pictures.

export const COLOURS = Array.from({ length: 8 }, (_, index) => `var(--route-${index + 1})`);
export const NO_DEVICE = "no device reported";

// The devices of a report, and what `Plot` needs to draw them.
export function deviceScale(data) {
  const devices = new Set();
  for (const stream of data.streams) for (const [, device] of stream.routes) devices.add(device || NO_DEVICE);
  for (const row of data.byApplication) devices.add(row.device || NO_DEVICE);
  devices.delete(NO_DEVICE);
  // The last colour is grey.
  const named = [...devices].sort();
  return {
    domain: [...named, NO_DEVICE],
    range: [...named.map((_, index) => COLOURS[index % (COLOURS.length - 1)]), COLOURS.at(-1)],
  };
}
