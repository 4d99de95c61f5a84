"""memory: arenas, their regions, the summary of all regions."""
import re

from records import make
from runs import Case

ARENAS, MOST = "stats/arena", (1 << 64) - 1
TYPES = "SCHEMA", "RING", "BUF", "MDU", "USD", "USTATS", "FLOWADV", "NEXUSADV", "SYSCTLS", "MDK", "KSD", "KSTATS"
MODES = "NOREDIRECT,MMAPOK,READONLY,PERSISTENT,MONOLITHIC,NOCACHE,MIRRORED"
EQUALS, MINUSES, PLUSES, BAR = "=" * 70 + "\n", "-" * 70 + "\n", "+" * 70 + "\n", " " * 14 + "|\n"


def region(number, kind=0, **values):
    return make("region", region_uuid=number.to_bytes(16, "big"), type=kind, **{"name": "r", "seg_count": 1, **values})


def arena(*regions, **values):
    return make("arena", regions=list(regions), **{"name": "a", **values})


def lines(*rows):
    return "".join(f"{title:>15}  {shown}\n" for title, shown in rows)


def block(kind, *values):
    titles = "allocs:", "frees:", "rescales:", "mode:", "objs:", "objs cnt*size:", "segsize:", "segments:"
    return lines(*zip((f"{kind} region:", *titles), values))


def total(memory):
    return MINUSES + lines(("TOTAL:", memory)) + MINUSES + "\n"


def summary(total, wired, **types):
    rows = "".join("{:>14}:   {:9} KB  {:9} KB\n".format(kind, *types.get(kind, (0, 0))) for kind in TYPES)
    return (PLUSES + " Tarvel Region Memory Usage Summary (deduplicated)\n" + PLUSES
            + "                         Total         Wired\n" + rows + MINUSES
            + f"         TOTAL:       {total:>5} MB      {wired:>5} MB\n" + MINUSES)


class Memory(Case):
    def test_ReportsArenasWithTheirProcessesAndRegions(self):
        name, none = "n" * 64, ("0*0 -> 0*0 (0.00% inflation)", "0 -> 0 (0.00% inflation)")
        table = arena(
            region(1, name="schema.en0", mem_total=65536 + 1023, mode=5, seg_size_req=4096, seg_size=16384, seg_count=4,
                   obj_count_req=100, obj_size_req=50, obj_count=128, obj_size=64, objs_per_seg=16, seg_in_use=3,
                   allocs=MOST, frees=6, rescales=5),
            region(2, 1, mem_total=1024, mem_wired=2048, seg_count=0),
            region(3, 7, mem_total=4095, mem_wired=1535, mode=0x8000007F, obj_count_req=7, seg_count=3, seg_in_use=2),
            region(4, 12, mem_total=1, mem_wired=513), name="tarvel-main", pids=[42, -2, 0, 42])
        self.expect({ARENAS: table + arena(name=name, type=1, pids=[42] * 8) + arena(type=2)}, "memory", "".join((
            EQUALS, lines(("NEXUS arena:", "tarvel-main"), ("", "curl.42"), ("", "<unknown>.-2")), EQUALS,
            block("SCHEMA", "schema.en0", MOST, 6, 5, "0x5<NOREDIRECT,READONLY>", "16 per segment",
                  "100*50 -> 128*64 (63.84% inflation)", "4096 -> 16384 (300.00% inflation)", "3/4 (75.00% in use)"),
            "        memory:  64 KB\n", BAR,
            block("NEXUSADV", "r", 0, 0, 0, f"0x8000007f<{MODES}>", "0 per segment", "7*0 -> 0*0 (0.00% inflation)",
                  none[1], "2/3 (66.67% in use)"), "  wired memory:  1 KB\n", BAR,
            block("UNKNOWN", "r", 0, 0, 0, "0x0<>", "0 per segment", *none, "0/1 (0.00% in use)"),
            "  wired memory:  0 KB\n", total("68 KB (wired 2 KB)"),  # of 70655 bytes: no region's rest is lost
            EQUALS, lines(("PLCY arena:", name), *[("", "curl.42")] * 8), EQUALS, total("0 KB"),
            EQUALS, lines(("SYSTEM arena:", "a")), EQUALS, total("0 KB"),
            summary("0.07", "0.00", SCHEMA=(64, 0), RING=(1, 2), NEXUSADV=(3, 1)))))

    def test_TypesAreNamedAndProductsWrapBeforeTheyAreCompared(self):
        fields = "obj_count_req obj_size_req obj_count obj_size seg_size_req seg_size seg_in_use seg_count".split()
        half, top = 1 << 32, 1 << 63
        rows = 2 * (
            (1, 4, 1, 1, 0, 9, 5, 1, "-75.00 0.00 500.00"), (1, top, 3, top, 4096, 1024, top, 1, "0.00 -75.00 0.00"),
            (half, half, 1, 1, 3, 4, 1, 3, "inf 33.33 33.33"), (half, half, top, 2, 7, 7, 1, -1, "-nan 0.00 0.00"),
            (0, 9, 9, 9, -1, 0, top + 1, 1, "0.00 -100.00 100.00"), (top, 0, 9, 9, 1, 2, 0, 1, "0.00 100.00 0.00"))
        table = arena(*(region(kind, kind, **dict(zip(fields, row))) for kind, row in enumerate(rows)), type=3)
        odd = [arena(region(99, kind), type=kind) for kind in (12, -1, 1 << 31)]
        out = self.run_on({ARENAS: table + b"".join(odd)}, "memory").out
        self.assertEqual(re.findall(r"\((\S+)% in", out), " ".join(row[-1] for row in rows).split() + ["0.00"] * 9)
        titles = [f"{name + ' region:':>15}" for name in TYPES] + [" UNKNOWN arena:", "UNKNOWN region:"] * 3
        self.assertEqual(re.findall("(?m)^(.*:)  [ar]$", out), [" UNKNOWN arena:", *titles])

    def test_SummaryCountsEachRegionOnceAsItAppearedFirst(self):
        first = arena(region(7, 2, mem_total=1572864, mem_wired=1000000), region(0, 4, mem_total=2047, seg_count=0))
        again = arena(region(7, 3, mem_total=9999999, mem_wired=9999999), region(0, 5, mem_total=1 << 20))
        odd = arena(region(8, 12, mem_total=1 << 20), region(9, -1, mem_total=1 << 20, mem_wired=1 << 20))
        most = arena(region(1, 8, mem_total=MOST, mem_wired=1 << 63), region(2, 8, mem_wired=1 << 63))
        many = b"".join(arena(*(region(12 * i + slot, 11, mem_total=1024) for slot in range(12))) for i in range(250))
        for table, expected in (
                (first + again + odd, summary("1.50", "0.95", BUF=(1536, 976), USD=(1, 0))),
                (again + first, summary("10.54", "9.54", MDU=(9765, 9765), USTATS=(1024, 0))),
                (most, summary("17592186044416.00", "0.00", SYSCTLS=(18014398509481983, 0))),
                (many * 2, summary("2.93", "0.00", KSTATS=(3000, 0)))):
            out = self.run_on({ARENAS: table}, "memory").out
            self.assertEqual(out[out.index("+"):], expected)

    def test_SummaryRemembersTheRegionsOfEarlierRuns(self):
        later = arena(region(1, 1, mem_total=5120), region(2, mem_total=2048, mem_wired=1024))
        seen = self.watch("memory -w 1", {ARENAS: arena(region(1, mem_total=1024))}, {ARENAS: later})
        self.assertEqual([part[part.index("+"):] for part in seen.out.split("\n<time>\n")[1:]],
                         [summary("0.00", "0.00", SCHEMA=(1, 0)), summary("0.00", "0.00", SCHEMA=(3, 1))])
