#!/usr/bin/env python3
"""The page of `./dev bench --peers`, made of figures that are known.

    report_test.py DIRECTORY_OF_THE_SCRIPT
"""
import contextlib
import json
import os
import sys
import tempfile
import unittest

sys.path.insert(0, sys.argv.pop(1))
import report
import texts


def spread(median):
    return {"low": median * 0.9, "median": median, "high": median * 1.1}


def peer(name, role, nanoseconds, limit=1000, ours=1200):
    return {"name": name, "role": role, "operations": 10, "nanoseconds": spread(nanoseconds),
            "to_limit": spread(nanoseconds / limit), "to_ours": spread(nanoseconds / ours),
            "ahead_of_ours": 1.0 if nanoseconds < ours else 0.0}


def contest(operation, size, cpus, *others, family="queues"):
    result = {"family": family, "operation": operation, "cpus": cpus,
              "peers": list(others) + [peer("bare pipe", "limit", 1000), peer("TAVO queue", "ours", 1200)]}
    if size is not None:
        result["size"] = size
    return result


def figures(*contests):
    return {"date": "2024-05-06", "quick": False, "rounds": 7, "round_milliseconds": 3, "contests": list(contests),
            "machine": {"cpu": "Some CPU", "architecture": "riscv64", "cpus": 3, "kernel": "Linux 5.4.3", "virtual": True,
                        "load": 1.25},
            "versions": {"ZeroMQ": "9.8.7", "compiler": "GCC 1.2.3"}}


def page(*contests, **changes):
    return "\n".join(report.page({**figures(*contests), **changes}))


def section(text, title):
    return text.split("\n## " + title + "\n")[1].split("\n## ")[0]


class PageTest(unittest.TestCase):
    def test_says_on_what_it_was_measured_and_with_what(self):
        text = page(contest("stream", 64, 1))
        for what in ("Some CPU, 3 CPUs, riscv64, a virtual machine, Linux 5.4.3", "load average was 1.2", "Date: 2024-05-06",
                     "7 rounds of 3 ms", "ZeroMQ 9.8.7", "compiler GCC 1.2.3", "./dev bench --peers"):
            self.assertIn(what, text)
        self.assertNotIn("quick run", text)

    def test_says_that_a_quick_run_is_rough(self):
        self.assertIn("quick run", page(contest("stream", 64, 1), quick=True))

    def test_a_machine_that_is_none_of_another_is_not_called_virtual(self):
        machine = dict(figures()["machine"], virtual=False)
        self.assertNotIn("virtual", page(contest("stream", 64, 1), machine=machine).split("## How")[0])

    def test_a_peer_ahead_is_said_with_where_by_how_much_and_why(self):
        text = section(page(contest("stream", 64, 1, peer("ZeroMQ", "peer", 240)),
                            contest("stream", 4096, 1, peer("ZeroMQ", "peer", 2400)),
                            contest("stream", 64, 2, peer("ZeroMQ", "peer", 600))), "Where a peer is ahead")
        self.assertIn("| queues: stream | ZeroMQ | 64 B on one CPU; 64 B on two CPUs | 0.20 to 0.50 | " +
                      texts.why("queues", "stream", "ZeroMQ"), text)
        self.assertNotIn("4 KiB", text)

    def test_a_peer_behind_or_as_fast_is_not_called_ahead_and_its_reason_is_not_printed(self):
        text = page(contest("stream", 64, 1, peer("ZeroMQ", "peer", 1190), peer("nng", "peer", 5000)))
        self.assertIn("Nowhere in this run.", section(text, "Where a peer is ahead"))
        self.assertNotIn(texts.why("queues", "stream", "ZeroMQ"), text)
        self.assertNotIn(texts.why("queues", "stream", "nng"), text)

    def test_a_peer_that_is_ahead_by_chance_is_not_called_ahead(self):
        erratic = peer("nng", "peer", 900)
        erratic["ahead_of_ours"] = 0.55
        self.assertIn("Nowhere in this run.", page(contest("stream", 64, 1, erratic)))
        erratic["ahead_of_ours"] = 0.65
        self.assertNotIn("Nowhere in this run.", page(contest("stream", 64, 1, erratic)))

    def test_the_limit_and_this_library_are_not_called_ahead(self):
        macro = peer("TAVO log, in the library", "ours", 1)
        text = page(contest("dropped line", None, 1, macro, family="logging"))
        self.assertIn("Nowhere in this run.", text)

    def test_a_peer_ahead_for_which_no_reason_is_known_is_said_all_the_same(self):
        text = section(page(contest("stream", 64, 1, peer("unheard of", "peer", 1))), "Where a peer is ahead")
        self.assertIn("| unheard of | 64 B on one CPU | 0.00 | Not looked into yet. |", text)

    def test_cells_have_ratio_quartiles_and_time(self):
        text = page(contest("round trip", 4096, 2, peer("nng", "peer", 3000)))
        self.assertIn("### Round trip, two CPUs\n\n|  | 4 KiB |\n| --- | --- |\n| bare pipe | 1.00 µs |\n"
                      "| TAVO queue | **1.20** (1.08 to 1.32), 1.20 µs |\n| nng | **3.00** (2.70 to 3.30), 3.00 µs |\n", text)

    def test_what_is_not_possible_is_said_with_the_limit(self):
        cannot = {"name": "System V", "role": "peer", "impossible": "limit msgmax"}
        text = page(contest("stream", 64, 1, peer("System V", "peer", 2000)), contest("stream", 65536, 1, cannot))
        self.assertIn("| System V | **2.00** (1.80 to 2.20), 2.00 µs | not possible: limit msgmax |", text)

    def test_operations_without_a_size_have_a_column_for_each_number_of_cpus(self):
        contests = [contest("mutex", None, cpus, peer("std::mutex", "peer", 100), family="locks") for cpus in (1, 2)]
        text = page(*contests)
        self.assertIn("### Mutex\n\n|  | one CPU | two CPUs |\n", text)
        self.assertIn("| locks: mutex | std::mutex | one CPU; two CPUs | 0.08 |", text)

    def test_times_are_told_in_units_that_suit(self):
        told = {0.234: "0.23 ns", 41.26: "41.3 ns", 999.4: "999 ns", 999.6: "1.00 µs", 12345: "12.3 µs", 2.5e6: "2.50 ms",
                3e9: "3000 ms"}
        self.assertEqual({time: report.time_text(time) for time in told}, told)

    def test_pictures_are_shown_where_there_are_any(self):
        text = "\n".join(report.page(figures(contest("round trip", 64, 1)), "pictures"))
        self.assertRegex(text, r"\n!\[[^\]]+\]\(pictures/bench-queues-round-trip\.svg\)\n")
        self.assertNotIn("![", page(contest("round trip", 64, 1)))

    def test_the_script_writes_the_page(self):
        with tempfile.TemporaryDirectory() as directory:
            source, target = os.path.join(directory, "figures.json"), os.path.join(directory, "page.md")
            with open(source, "w", encoding="utf-8") as file:
                json.dump(figures(contest("stream", 64, 1)), file)
            sys.argv[1:] = [source, target]
            with contextlib.ExitStack() as stack:
                stack.callback(sys.argv.__delitem__, slice(1, None))
                report.main()
            with open(target, encoding="utf-8") as file:
                self.assertEqual(file.read().rstrip("\n"), page(contest("stream", 64, 1)).rstrip("\n"))


class ReasonsTest(unittest.TestCase):
    def test_one_of_an_operation_goes_before_one_of_all(self):
        keys = [key for key in texts.REASONS if key[1] is not None]
        self.assertTrue(keys)
        for family, operation, name in keys:
            self.assertEqual(texts.why(family, operation, name), texts.REASONS[family, operation, name])
            if (family, None, name) in texts.REASONS:
                self.assertEqual(texts.why(family, "another", name), texts.REASONS[family, None, name])


if __name__ == "__main__":
    unittest.main()
