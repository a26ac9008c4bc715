"""The pictures in a real browser, on a light and on a dark page: what is written can be read, each
colour of the legend stands out, tooltips are there, and no script and no file is asked for."""

import html
import json
import os
import re
import shutil
import subprocess

import harness

browser = shutil.which("chromium") or shutil.which("chromium-browser")
if browser is None:
    harness.skip("the program chromium is not there")
checks = harness.Failures()
folder = harness.scratch()
KINDS = ("map", "tree", "fill", "keys")

lines = ["use catalog"]
for i in range(16, 400):
    lines.append('insert 2:"file %d" file{id:%d}' % (i, i))
    lines.append('insert %d:"" thread-file{parent:2,name:"file %d"}' % (i, i))
for i in range(16, 400, 3):
    lines.append('delete 2:"file %d"' % i)
(folder / "fill.tr").write_text("\n".join(lines) + "\n")
code, out, err = harness.text("apply", "--new", "2M,node=1024", "fill.tr", "--save", "volume.img",
                              "-q", cwd=folder)
assert code == 0, err
pages = {}
for kind in KINDS:
    code, out, err = harness.text("plot", "volume.img", "--kind", kind, "-o", kind + ".html",
                                  cwd=folder)
    checks.equal(code, 0, "plot of the %s: %s" % (kind, err))
    pages[kind] = (folder / (kind + ".html")).read_text("utf-8")
    foreign = [url for url in re.findall(r"""(?:src|href|url)\s*[=(]\s*["']?([^"')\s>]+)""",
                                         pages[kind])]
    checks.equal(foreign, [], kind + ": loads from elsewhere")
    checks.check("<script" not in pages[kind], kind + ": has a script")

# Each page lies in a frame of its own; the one around them looks into them all.
PROBE = r"""
const errors = [];
addEventListener("error", event => errors.push(String(event.message)));
const rgb = text => (text.match(/[\d.]+/g) || []).slice(0, 3).map(Number);
const light = color => {
  const part = rgb(color).map(c => c / 255).map(c =>
    c <= 0.03928 ? c / 12.92 : ((c + 0.055) / 1.055) ** 2.4);
  return 0.2126 * part[0] + 0.7152 * part[1] + 0.0722 * part[2];
};
const contrast = (a, b) => {
  const [low, high] = [light(a), light(b)].sort((x, y) => x - y);
  return (high + 0.05) / (low + 0.05);
};
addEventListener("load", () => {
  const found = {};
  for (const frame of document.querySelectorAll("iframe")) {
    const page = frame.contentDocument, view = frame.contentWindow;
    const style = node => view.getComputedStyle(node);
    const back = style(page.querySelector(".page")).fill;
    const svg = page.querySelector("svg").getBoundingClientRect();
    const shapes = [...page.querySelectorAll("rect:not(.page)")];
    const beneath = text => {  // the box that a label stands in
      const at = text.getBoundingClientRect();
      const x = at.left + at.width / 2, y = at.top + at.height / 2;
      const box = shapes.filter(s => { const r = s.getBoundingClientRect();
        return r.left <= x && x <= r.right && r.top <= y && y <= r.bottom; }).pop();
      return box ? style(box).fill : back;
    };
    found[frame.name] = {
      dark: light(back) < 0.2,
      texts: [...page.querySelectorAll("text")].map(text => [text.textContent,
        contrast(style(text).fill, beneath(text)), parseFloat(style(text).fontSize)]),
      outside: [...page.querySelectorAll("text,rect")].filter(node => {
        const r = node.getBoundingClientRect();
        return r.right > svg.right + 1 || r.left < svg.left - 1 || r.bottom > svg.bottom + 1;
      }).map(node => node.textContent || node.getAttribute("class")),
      shapes: shapes.map(node => [node.getAttribute("class"), Math.max(
        contrast(style(node).fill, back),
        style(node).stroke === "none" ? 1 : contrast(style(node).stroke, back))]),
      tooltips: [...page.querySelectorAll("rect > title")].map(node => node.textContent),
      title: page.title,
    };
  }
  const out = document.createElement("pre");
  out.id = "found";
  out.textContent = JSON.stringify({errors, pages: found});
  document.body.append(out);
});
"""
frames = "".join('<iframe name="%s" width="1000" height="900" srcdoc="%s"></iframe>\n'
                 % (kind, html.escape(pages[kind], quote=True)) for kind in KINDS)
(folder / "all.html").write_text("<!DOCTYPE html><meta charset=utf-8><script>%s</script>\n%s"
                                 % (PROBE, frames), "utf-8")


def look(scheme):
    options = ["--headless", "--no-sandbox", "--disable-gpu", "--disable-dev-shm-usage",
               "--user-data-dir=%s" % (folder / ("profile-" + scheme)),
               "--blink-settings=preferredColorScheme=%d" % (0 if scheme == "dark" else 1),
               "--virtual-time-budget=5000", "--enable-logging=stderr"]
    done = subprocess.run([browser, *options, "--dump-dom", "file://%s" % (folder / "all.html")],
                          capture_output=True, timeout=300, env=dict(os.environ, HOME=str(folder)))
    match = re.search(r'<pre id="found">(.*?)</pre>', done.stdout.decode("utf-8", "replace"), re.S)
    if match is None:
        harness.skip("the browser gives no page: " + done.stderr.decode("utf-8", "replace")[-300:])
    shown = [line for line in done.stderr.decode("utf-8", "replace").splitlines()
             if "CONSOLE" in line]
    checks.equal(shown, [], scheme + ": messages on the console")
    return json.loads(html.unescape(match.group(1)))


LEGENDS = {"map": ["header", "map", "index", "leaf, empty", "full", "free", "unreadable"],
           "tree": [], "fill": [], "keys": ["first key", "last key"]}
for scheme in ("light", "dark"):
    found = look(scheme)
    checks.equal(found["errors"], [], scheme + ": errors")
    for kind in KINDS:
        page, what = found["pages"][kind], "%s, %s: " % (kind, scheme)
        checks.equal(page["dark"], scheme == "dark", what + "background")
        texts = [text for text, _, _ in page["texts"]]
        checks.check(len(texts) >= 4 and page["title"], what + "texts: %s" % texts)
        for text, contrast, size in page["texts"]:
            checks.check(contrast >= 4.5, "%s%r has a contrast of %.1f" % (what, text, contrast))
            checks.check(size >= 10, "%s%r has %g pixels" % (what, text, size))
        for word in LEGENDS[kind]:
            checks.check(word in texts, what + "the legend lacks " + word)
        checks.equal(page["outside"], [], what + "drawn outside the picture")
        checks.check(len(page["tooltips"]) > 5 and all(page["tooltips"]),
                     what + "tooltips: %d" % len(page["tooltips"]))
        for style, contrast in page["shapes"]:
            if style.split()[0] not in ("free", "leaf"):
                checks.check(contrast >= 3,
                             "%s%s stands out by %.1f only" % (what, style, contrast))
            elif style.startswith("leaf"):
                checks.check(contrast >= 1.1, "%s%s cannot be told from the page (%.2f)"
                             % (what, style, contrast))
checks.finish()
