"""The page of `mempool report` in headless Chromium: its figures are those of --json.

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
    """Groups of several sizes and lifetimes, one with a name that HTML could take for markup."""
    chance = random.Random(3)
    names = [HOSTILE, "parse_tree(Node const&)"] + [f"caller_{i}" for i in range(40)]
    stacks = names[:1] + [f"main+0x9 (demo);{'loop+0x5 (demo);' if i % 2 else ''}{name};xmalloc+0x1 (demo)"
                          for i, name in enumerate(names[1:])]
    with open(path, "w", encoding="utf-8") as out:
        for key, value in (("program", "demo <i>"), ("by", "stack"), ("threads", "2"),
                           ("cpu_seconds", "1.5"), ("allocation_share", "0.25"), ("allocation_share_error", "0.05")):
            out.write(f"xmpt:i:{key}:{value}\n")
        for pool, name in enumerate(stacks):
            out.write(f"xmpt:c:{pool:016x}\nxmpt:n:{pool:016x}:{name}\n")
        live = [[] for _ in names]
        for step in range(20000):
            if step % 500 == 0:
                out.write(f"xmpt:t:{step * step // 10000}\n")
            pool = min(int(chance.expovariate(0.2)), len(names) - 1)
            if live[pool] and chance.random() < 0.4:
                out.write(f"xmpt:f:{pool:016x}:{live[pool].pop():016x}:\n")
            else:
                live[pool].append(16 * step)
                size = chance.choice([8, 24, 24, 40, 100, 600, 3000])
                if step % 1500 < 3:  # A size class with little memory, and one with very little.
                    size = 300 if step > 2 else 200
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
        advice = os.path.join(cls.folder.name, "advice.json")
        advised = subprocess.run([MEMPOOL, "advise", "--json", "--seconds", "1", trace], check=True,
                                 stdout=subprocess.PIPE)
        cls.advice = json.loads(advised.stdout)
        cls.advice["plan"] = {"sentence": "Two pools.", "pools": [
            {"groups": [HOSTILE] + list("abcd"), "blocks": 4000, "peak_bytes": 98765, "free_alls": 3,
             "frees_replaced": 3990}]}
        with open(advice, "w", encoding="utf-8") as out:
            json.dump(cls.advice, out)
        made = subprocess.run([MEMPOOL, "report", "--json", "--html", cls.page, "--advice", advice, trace],
                              check=True, stdout=subprocess.PIPE)
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
        self.assertEqual(shown["blocks"], f"{self.json['blocks']:,}")
        self.assertEqual(shown["never_bytes"], shown_bytes(self.json["never_bytes"]))
        for key, part in (("temporary", "temporary"), ("in_records.blocks", "in_records")):
            part = self.json[part] if part == key else self.json[part]["blocks"]
            self.assertEqual(shown[key], shown_percent(part, self.json["blocks"]))
        self.assertEqual(shown["allocation_share"], "25.0 %")
        self.assertIn("estimated, +/- 5.0 %", self.browser.page_source)

        peak, groups = self.json["peak"], self.json["groups"]
        share = [f"{shown_bytes(group['at_peak']['bytes'])} by {group['name']}" for group in groups[:3]]
        more = 100 * (peak["pools"] / peak["heap_chunks"] - 1)
        self.assertGreater(more, 3)
        self.assertLess(abs(peak["one_pool"] / peak["heap_chunks"] - 1), 0.03)
        self.assertEqual([text.replace("\u00a0", " ") for text in self.texts("#verdict")], [
            f"At the peak the program has requested {shown_bytes(peak['asked'])} in "
            f"{peak['blocks']:,} blocks: {share[0]}, {share[1]} and {share[2]}."])
        self.assertEqual(self.texts("#held-note"), [
            f"For the blocks at the peak a pool for each group would hold {shown_bytes(peak['pools'])}, "
            f"{more:.0f} % more than the heap’s {shown_bytes(peak['heap_chunks'])}; a single pool for all "
            f"{shown_bytes(peak['one_pool'])}, about as much as the heap."])
        large = [group for group in groups if group["at_peak"]["bytes"] >= 0.001 * peak["asked"]][:12]
        self.assertEqual(self.texts("#peak text.mark"), [group["name"] for group in large])
        self.assertEqual(self.texts("#peak text:not(.mark)"), [
            f"{shown_bytes(group['at_peak']['bytes'])}, "
            f"{shown_percent(group['at_peak']['bytes'], peak['asked'])}, "
            f"{group['at_peak']['blocks']:,} blocks" for group in large])
        widths = self.browser.execute_script(
            "return Array.from(document.querySelectorAll('#peak rect.bar'),"
            " bar => Number(bar.getAttribute('width')))")
        for width, group in zip(widths, large):
            self.assertAlmostEqual(width / widths[0],
                                   group["at_peak"]["bytes"] / large[0]["at_peak"]["bytes"], delta=0.01)
        together = sorted(groups, key=lambda group: -group["together"]["blocks"])[:8]
        self.assertEqual(self.texts("#together tbody td"), [text for group in together for text in (
            group["name"], f"{group['together']['blocks']:,}", f"{group['together']['longest']:,}",
            f"{group['together']['clear_runs']:,}", f"{group['together']['clear_blocks']:,}",
            shown_percent(group["together"]["clear_blocks"], group["blocks"]))])
        self.assertEqual(self.texts("h1"), ["demo <i>"])
        self.assertIn("2 threads", self.texts("#facts")[0])
        self.assertIn("1 × truncated or malformed", self.texts(".banner:not(noscript *)")[-1])

        held = self.texts("#held tbody td")
        for row, key in enumerate(("asked", "pools", "one_pool", "heap_chunks", "heap")):
            self.assertEqual(held[4 * row + 1:4 * row + 4], [
                shown_bytes(peak[key]), shown_percent(peak[key], peak["heap_chunks"]),
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
        rows = self.json["fill"]["classes"]
        held = [max(row["records"]) * (row["data_size"] + 4) for row in rows]
        cells = sum(1 for row, most in zip(rows, held) for records in row["records"]
                    if records and most >= sum(held) / 100)
        shares = sorted(most / sum(held) for most in held)
        self.assertTrue(shares[0] < 0.01 < shares[1] < 0.1, shares)
        self.assertEqual(len(self.texts("#fill rect.cell")), cells)
        heights = self.browser.execute_script(
            "return Array.from(document.querySelectorAll('#lifetimes rect.bar'),"
            " bar => Number(bar.getAttribute('height')))")
        shares = [blocks for blocks in self.json["lifetimes"] if blocks] + [self.json["never"]]
        for height, share in zip([height for height in heights if height], shares):
            self.assertAlmostEqual(height / max(heights), share / max(shares), delta=0.01)
        for chart in self.browser.find_elements(By.CSS_SELECTOR, ".chart > svg"):
            self.assertTrue(chart.get_attribute("aria-label"))

        # A tooltip has the figures of the point below the pointer.
        point, tip = self.point_in_the_middle("timeline", lines)
        self.assertAlmostEqual(lines["seconds"][point] / max(lines["seconds"]), 0.5, delta=0.06)
        self.assertIn(f"Heap: {shown_bytes(lines['heap_chunks'][point])}", tip)
        self.assertIn(f"Blocks: {lines['blocks'][point]:,}", tip)
        self.browser.find_elements(By.CSS_SELECTOR, "#unit button")[1].click()
        point, tip = self.point_in_the_middle("timeline", lines)
        self.assertAlmostEqual(lines["event"][point] / self.json["events"], 0.5, delta=0.02)

    def point_in_the_middle(self, chart, lines):
        tip = self.browser.execute_script(
            "const area = document.querySelector(`#${arguments[0]} rect[fill=transparent]`);"
            "const box = area.getBoundingClientRect();"
            "area.dispatchEvent(new MouseEvent('mousemove', {clientX: box.left + box.width / 2,"
            " clientY: box.top + 20, bubbles: true}));"
            "return document.getElementById('tip').textContent", chart).split("\n")
        return lines["event"].index(int(tip[0].replace("Event ", "").replace(",", ""))), tip

    def test_growth_stacks_the_groups(self):
        lines, groups = self.json["growth"], self.json["growth"]["groups"]
        self.assertEqual([group["name"] for group in groups],
                         [group["name"] for group in self.json["groups"][:9]])
        peak = lines["event"].index(self.json["peak"]["event"])
        self.assertEqual([group["bytes"][peak] for group in groups],
                         [group["at_peak"]["bytes"] for group in self.json["groups"][:9]])
        sums = [sum(parts) for parts in zip(lines["others"], *(group["bytes"] for group in groups))]
        self.assertEqual(sums[peak], self.json["peak"]["asked"])
        point, tip = self.point_in_the_middle("growth", lines)
        self.assertIn(f"In all: {shown_bytes(sums[point])}", tip)
        self.assertIn(f"{groups[7]['name']}: {shown_bytes(groups[7]['bytes'][point])}", tip)
        tops = self.browser.execute_script(
            "return Array.from(document.querySelectorAll('#growth path.layer'), path => path"
            ".getAttribute('d').slice(1).split('L').map(at => Number(at.split(',')[1])))")
        self.assertEqual(len(tops), 1 + sum(max(group["bytes"]) >= 0.01 * max(sums)
                                            for group in groups))
        scale = (236 - tops[-1][peak]) / sums[peak]
        for top, total in zip(tops[-1], sums):
            self.assertAlmostEqual(236 - top, total * scale, delta=0.01)

    def test_stacks_are_as_wide_as_their_bytes(self):
        drawn = self.frames()
        depths = {}
        for stack in self.json["stacks"]:
            for depth, frame in enumerate(stack["frames"], 1):
                key = (frame.replace("+0x9", "").replace("+0x5", "").replace("+0x1", ""), depth)
                depths[key] = depths.get(key, 0) + stack["at_peak"]["bytes"]
        scale = drawn["all stacks", 0] / self.json["peak"]["asked"]
        for (name, depth), size in depths.items():
            if name.startswith("xmalloc") or size * scale < 2:
                continue
            self.assertAlmostEqual(drawn[name, depth], size * scale, delta=0.02 * size * scale, msg=name)
        self.browser.execute_script(
            "d3.selectAll('#stacks rect.frame').filter(frame => frame.name === 'loop (demo)').each("
            "function (frame) { d3.select(this).on('click')(frame); })")
        widened = self.frames()
        self.assertAlmostEqual(widened["loop (demo)", 2], drawn["all stacks", 0], delta=0.1)
        self.assertAlmostEqual(widened["main (demo)", 1], drawn["all stacks", 0], delta=0.1)
        self.assertNotIn((HOSTILE, 1), widened)

    def frames(self):
        return {(name, round(top / 22)): width for name, top, width in self.browser.execute_script(
            "return Array.from(document.querySelectorAll('#stacks rect.frame'), one => ["
            "d3.select(one).datum().name, d3.transform(one.parentNode.getAttribute('transform'))"
            ".translate[1], Number(one.getAttribute('width'))])")}

    def test_advice_is_shown(self):
        advice, heap = self.advice, self.advice["heap"]
        self.assertEqual(self.texts("#sentences p"), advice["sentences"])
        self.assertEqual(self.texts("#environment"), ["\n".join(
            f"export {name}={value}" for name, value in advice["environment"].items())])
        rows = sorted(enumerate(advice["settings"]), key=lambda row: row[1]["ns_per_event"] * row[1]["bytes_held"])
        named = {advice[name]: name for name in ("advised", "best", "smallest", "fastest")}
        expected = [["heap", "", "", "", "", heap, ""]]
        if advice["mimalloc"]:
            expected.append(["mimalloc", "", "", "", "", advice["mimalloc"], ""])
        expected += [[f"{row['bucket_size']:,}", f"{row['max_record_size']:,}", str(row["min_record_size"]),
                      str(row["data_alignment"]), "kept" if row["keep_empty_buckets"] else "released", row,
                      ", ".join(name for name in ("fastest", "smallest", "best", "advised") if advice[name] == i)]
                     for place, (i, row) in enumerate(rows) if place < 8 or i in named]
        self.assertEqual(self.texts("#settings-table tbody td"), [text for row in expected for text in (
            *row[:5], f"{row[5]['ns_per_event']:.1f}", f"{row[5]['ns_per_event'] / heap['ns_per_event']:.2f}",
            shown_bytes(row[5]["bytes_held"]), f"{row[5]['bytes_held'] / heap['bytes_held']:.2f}", row[6])])

        self.assertEqual(self.texts("#plan, #plan-table tbody td"), [
            "Two pools.", f"{HOSTILE}, a, b, c and 1 more", "4,000", "98.8 KB", "3", "3,990"])

    def test_groups_sort_and_filter(self):
        groups = self.json["groups"]
        names = "#groups tbody td.name"
        self.assertEqual(self.texts(names), [group["name"] for group in groups[:25]])
        self.browser.find_element(By.CSS_SELECTOR, "#all-groups summary").click()
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
            self.assertEqual(self.browser.execute_script(
                "return getComputedStyle(document.getElementById('together').parentNode, '::before')"
                ".content") != "none", width == 390)
            for chart in ("peak", "stacks", "growth", "timeline", "sizes", "lifetimes", "fill"):
                element = self.browser.find_element(By.CSS_SELECTOR, f"#{chart} > svg")
                picture = Image.open(io.BytesIO(element.screenshot_as_png)).convert("L")
                histogram = picture.histogram()
                ground = max(range(256), key=histogram.__getitem__)
                self.assertEqual(ground > 128, scheme == "light")
                marked = sum(count for level, count in enumerate(histogram) if abs(level - ground) > 20)
                self.assertGreater(marked / sum(histogram), 0.02, (chart, width, scheme))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1])
