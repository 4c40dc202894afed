"""Counts the test cases of JUnit reports: prints "PASSED FAILED" and names what failed.

A skipped or disabled case is a failed one: a test that doesn't run proves nothing.
"""

import sys
import xml.etree.ElementTree as ElementTree
from pathlib import Path

_BAD = ("failure", "error", "skipped")


def bad(case: ElementTree.Element) -> bool:
    skipped = case.get("status") == "notrun" or case.get("result") == "skipped"
    return skipped or any(case.find(kind) is not None for kind in _BAD)


def main(folder: str) -> None:
    results: dict[tuple[str, str, str], bool] = {}
    for report in sorted(Path(folder).rglob("*.xml")):
        try:
            suites = list(ElementTree.parse(report).iter("testsuite"))
        except ElementTree.ParseError:
            # Cut off: its program died while it ran.
            results[(report.name, "", "unreadable report")] = False
            continue
        for suite in suites:
            for case in suite.findall("testcase"):
                group = f"{suite.get('name')} {case.get('classname')}"
                key = (report.name, group, case.get("name", ""))
                # A test whose tear-down fails as well is listed twice.
                results[key] = results.get(key, True) and not bad(case)
    for (_report, group, name), good in results.items():
        if not good:
            print(f"FAILED {group} {name}", file=sys.stderr)
    passed = sum(results.values())
    print(passed, len(results) - passed)


main(sys.argv[1])
