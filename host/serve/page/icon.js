// The picture of an application; its first letter where the device has none, or it does not come.

import { element } from "./elements.js";

const SIDE = 60;

export function iconOf(application) {
  if (!application.icon) return letter(application.name);
  const image = element("img", {
    loading: "lazy", decoding: "async", alt: "", width: SIDE, height: SIDE, draggable: "false",
  });
  image.addEventListener("error", () => image.replaceWith(letter(application.name)), { once: true });
  image.src = application.icon;
  return image;
}

function letter(name) {
  return element("span", { class: "letter", "aria-hidden": "true" }, [...name][0]?.toUpperCase() ?? "?");
}
