"""The page of `mempool report` in headless Chromium: what a reader sees there is what --json says.

Takes mempool, chromium and chromedriver. Needs Debian's python3-selenium and python3-pil."""

import io
import json
import os
import random
import subprocess
import sys
import tempfile
import unittest

from PIL import Image
from selenium import webdriver
from selenium.webdriver.chrome.service import Service
from selenium.webdriver.common.by import By

MEMPOOL, CHROMIUM, CHROMEDRIVER = sys.argv[1:4]
HOSTILE = "</script><script>document.title='broken'</script>\"'&<b>ü\u2028"


def write_trace(path):
    """Some groups of other sizes and lifetimes, one with a name that is no friend of HTML."""
    chance = random.Random(3)
    names = [HOSTILE, "parse_tree(Node const&)"] + [f"caller_{i}" for i in range(40)]
    with open(path, "w", encoding="utf-8") as out:
        for key, value in (("program", "demo <i>"), ("by", "caller"), ("threads", "2"),
                           ("cpu_seconds", "1.5"), ("allocation_share", "0.25")):
            out.write(f"xmpt:i:{key}:{value}\n")
        for pool, name in enumerate(names):
            out.write(f"xmpt:c:{pool:016x}\nxmpt:n:{pool:016x}:{name}\n")
        live = [[] for _ in names]
        for step in range(20000):
            pool = min(int(chance.expovariate(0.2)), len(names) - 1)
            if live[pool] and chance.random() < 0.4:
                out.write(f"xmpt:f:{pool:016x}:{live[pool].pop():016x}:\n")
            else:
                live[pool].append(16 * step)
                size = chance.choice([8, 24, 24, 40, 100, 600, 3000])
                out.write(f"xmpt:a:{pool:016x}:{16 * step:016x}:{size}\n")
        out.write("xmpt:f:bad\n")


def shown_bytes(value):
    units = ["B", "KB", "MB", "GB"]
    unit = 0
    while value >= 999.5:
        value, unit = value / 1000, unit + 1
    digits = 0 if unit == 0 or value >= 99.95 else 1 if value >= 9.995 else 2
    return f"{value:.{digits}f} {units[unit]}"


def shown_percent(part, whole):
    return f"{100 * part / whole:.1f} %"


class PageTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = tempfile.TemporaryDirectory()
        trace = os.path.join(cls.folder.name, "trace")
        cls.page = os.path.join(cls.folder.name, "page.html")
        write_trace(trace)
        made = subprocess.run([MEMPOOL, "report", "--json", "--html", cls.page, trace], check=True,
                              stdout=subprocess.PIPE)
        cls.json = json.loads(made.stdout)

        options = webdriver.ChromeOptions()
        options.binary_location = CHROMIUM
        for argument in ("--headless", "--no-sandbox", "--disable-gpu", "--disable-quic",
                         "--no-first-run", "--disable-background-networking",
                         "--disable-component-update", "--disable-sync", "--disable-dev-shm-usage",
                         f"--user-data-dir={cls.folder.name}/profile", "--window-size=1200,1000"):
            options.add_argument(argument)
        options.set_capability("goog:loggingPrefs", {"browser": "ALL"})
        cls.browser = webdriver.Chrome(service=Service(CHROMEDRIVER), options=options)
        cls.browser.set_page_load_timeout(60)

    @classmethod
    def tearDownClass(cls):
        cls.browser.quit()
        cls.folder.cleanup()

    def setUp(self):
        self.size_and_scheme(1200, "light")
        self.browser.get("file://" + self.page)

    def tearDown(self):
        self.assertEqual(self.browser.get_log("browser"), [])

    def size_and_scheme(self, width, scheme):
        self.browser.execute_cdp_cmd("Emulation.setDeviceMetricsOverride", {
            "width": width, "height": 1000, "deviceScaleFactor": 1, "mobile": False})
        self.browser.execute_cdp_cmd("Emulation.setEmulatedMedia", {
            "features": [{"name": "prefers-color-scheme", "value": scheme}]})

    def texts(self, selector):
        return self.browser.execute_script(
            "return Array.from(document.querySelectorAll(arguments[0]), one => one.textContent)",
            selector)

    def test_figures_are_those_of_the_json(self):
        shown = {}
        for one in self.browser.find_elements(By.CSS_SELECTOR, "[data-figure]"):
            value = self.json
            for key in one.get_attribute("data-figure").split("."):
                value = value[key]
            self.assertEqual(float(one.get_attribute("data-value")), value)
            shown[one.get_attribute("data-figure")] = one.text
        peak = self.json["peak"]
        self.assertEqual(shown["peak.asked"], shown_bytes(peak["asked"]))
        self.assertEqual(shown["peak.pools"], shown_bytes(peak["pools"]))
        self.assertEqual(shown["blocks"], f"{self.json['blocks']:,}")
        self.assertEqual(shown["never"], shown_percent(self.json["never"], self.json["blocks"]))
        self.assertEqual(shown["allocation_share"], "25.0 %")
        self.assertEqual(self.texts("h1"), ["demo <i>"])
        self.assertIn("2 threads", self.texts("#facts")[0])
        self.assertIn("1 × truncated or malformed", self.texts(".banner:not(noscript *)")[-1])

        held = self.texts("#held tbody td")
        for row, key in enumerate(("asked", "pools", "one_pool", "heap", "heap_chunks")):
            self.assertEqual(held[4 * row + 1:4 * row + 4], [
                shown_bytes(peak[key]), shown_percent(peak[key], peak["heap"]),
                shown_bytes(self.json["most"][key])])
        lifetimes = [blocks for blocks in self.json["lifetimes"]] + [self.json["never"]]
        counted = [int(text.replace(",", "")) for text in
                   self.texts("#lifetimes-table tbody td:nth-child(2)")]
        self.assertEqual(counted, [blocks for i, blocks in enumerate(lifetimes)
                                   if blocks or i == len(lifetimes) - 1 or any(lifetimes[i:-1])])
        sizes = sorted(self.json["sizes"], key=lambda row: -row["blocks"])
        self.assertEqual(self.texts("#sizes-table tbody td:nth-child(2)"),
                         [f"{row['blocks']:,}" for row in sizes])

    def test_charts_show_the_figures(self):
        lines = self.json["timeline"]
        drawn = self.browser.execute_script(
            "return Array.from(document.querySelectorAll('#timeline .chart path.line, #timeline "
            "path.line'), path => path.getAttribute('d').split('L').length)")
        self.assertEqual(drawn, [len(lines["event"])] * 4)
        cells = sum(1 for row in self.json["fill"]["classes"] for records in row["records"] if records)
        self.assertEqual(len(self.texts("#fill rect.cell")), cells)
        heights = self.browser.execute_script(
            "return Array.from(document.querySelectorAll('#lifetimes rect.bar'),"
            " bar => Number(bar.getAttribute('height')))")
        shares = [blocks for blocks in self.json["lifetimes"] if blocks] + [self.json["never"]]
        for height, share in zip([height for height in heights if height], shares):
            self.assertAlmostEqual(height / max(heights), share / max(shares), delta=0.01)
        for chart in self.browser.find_elements(By.CSS_SELECTOR, ".chart > svg"):
            self.assertTrue(chart.get_attribute("aria-label"))

        # A tooltip tells the figures of the point below the pointer.
        tip = self.browser.execute_script(
            "const area = document.querySelector('#timeline rect[fill=transparent]');"
            "const box = area.getBoundingClientRect();"
            "area.dispatchEvent(new MouseEvent('mousemove', {clientX: box.left + box.width / 2,"
            " clientY: box.top + 20, bubbles: true}));"
            "return document.getElementById('tip').textContent").split("\n")
        point = lines["event"].index(int(tip[0].replace("Event ", "").replace(",", "")))
        self.assertAlmostEqual(lines["event"][point] / self.json["events"], 0.5, delta=0.02)
        self.assertIn(f"Heap: {shown_bytes(lines['heap_chunks'][point])}", tip)
        self.assertIn(f"Blocks: {lines['blocks'][point]:,}", tip)

    def test_groups_sort_and_filter(self):
        groups = self.json["groups"]
        names = "#groups tbody td.name"
        self.assertEqual(self.texts(names), [group["name"] for group in groups[:25]])
        self.browser.find_element(By.ID, "groups-more").click()
        heads = self.browser.find_elements(By.CSS_SELECTOR, "#groups th")
        heads[2].find_element(By.TAG_NAME, "button").click()
        counts = [f"{blocks:,}" for blocks in sorted((group["blocks"] for group in groups), reverse=True)]
        self.assertEqual(self.texts("#groups tbody td:nth-child(3)"), counts)
        self.assertEqual(heads[2].get_attribute("aria-sort"), "descending")
        heads[2].find_element(By.TAG_NAME, "button").click()
        self.assertEqual(self.texts("#groups tbody td:nth-child(3)"), counts[::-1])
        self.assertEqual(heads[2].get_attribute("aria-sort"), "ascending")
        heads[0].find_element(By.TAG_NAME, "button").click()
        self.assertEqual(heads[2].get_attribute("aria-sort"), "none")
        self.assertEqual(sorted(self.texts(names)), sorted(group["name"] for group in groups))
        self.assertLess(self.texts(names).index("caller_1"), self.texts(names).index("caller_2"))
        self.browser.find_element(By.ID, "groups-filter").send_keys("SCRIPT")
        self.assertEqual(self.texts(names), [HOSTILE])

    def test_it_can_be_seen_at_any_width_and_in_the_dark(self):
        for width, scheme in ((1200, "light"), (1200, "dark"), (390, "light"), (390, "dark")):
            self.size_and_scheme(width, scheme)
            self.browser.get("file://" + self.page)
            wide = self.browser.execute_script("return document.documentElement.scrollWidth")
            self.assertLessEqual(wide, width)
            for chart in ("timeline", "sizes", "lifetimes", "fill"):
                element = self.browser.find_element(By.CSS_SELECTOR, f"#{chart} > svg")
                picture = Image.open(io.BytesIO(element.screenshot_as_png)).convert("L")
                histogram = picture.histogram()
                ground = max(range(256), key=histogram.__getitem__)
                self.assertEqual(ground > 128, scheme == "light")
                marked = sum(count for level, count in enumerate(histogram) if abs(level - ground) > 20)
                self.assertGreater(marked / sum(histogram), 0.02, (chart, width, scheme))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1])
