"""Writes what is made from elsewhere into the manual pages and the schema, or tells that it is stale.

update.py [--check] VOCABULARY-PRINTER. The results are committed, so that they can be read on the
repository's web page, and a build needs neither this script nor a compiler for the build machine.
"""

import re
import subprocess
import sys
import xml.etree.ElementTree as ElementTree
from pathlib import Path

REPOSITORY = Path(__file__).resolve().parent.parent
INTERFACES = REPOSITORY / "src/dbus/interfaces"


def printed(printer: str, what: str) -> str:
    return subprocess.run([printer, what], check=True, capture_output=True, text=True).stdout


def filled(page: str, marker: str, content: str) -> str:
    """The page with what stands between the marker and the next end replaced."""
    begin = f"<!-- {marker}: made by update.py, do not edit -->\n"
    pattern = re.compile(re.escape(begin) + r".*?(?=<!-- end -->)", re.DOTALL)
    text, count = pattern.subn(lambda _: f"{begin}\n{content.strip()}\n\n", page)
    assert count == 1, marker
    return text


def comments(text: str) -> dict[str, str]:
    """The documentation comments of an interface, by the name that each begins with."""
    found = re.findall(r"<!--\s*\n\s*([\w.]+):\s*\n(.*?)-->", text, re.DOTALL)
    return {name: body for name, body in found}


def paragraphs(body: str) -> tuple[dict[str, str], list[str]]:
    """The remarks on arguments, and the paragraphs, of one comment."""
    arguments: dict[str, str] = {}
    texts: list[str] = []
    for block in re.split(r"\n\s*\n", body):
        words = " ".join(line.strip() for line in block.strip().splitlines())
        parts = re.split(r"(?:^|\s)@(\w+):\s", words)
        if len(parts) > 1:
            arguments.update(zip(parts[1::2], (part.strip() for part in parts[2::2])))
        elif words:
            texts.append(re.sub(r"[@#]([\w.:]+)", lambda match: match[1].replace("::", " "), words))
    return arguments, texts


def escaped(text: str) -> str:
    return re.sub(r"([*_<>])", r"\\\1", re.sub(r"@(\w+)", r"\1", text))


def member(element: ElementTree.Element, notes: dict[str, str]) -> list[str]:
    arguments, texts = paragraphs(notes.get(element.get("name", ""), ""))
    signature = ", ".join(
        f"{'out ' if argument.get('direction') == 'out' else ''}{argument.get('name')} "
        f"{argument.get('type')}"
        for argument in element.findall("arg")
    )
    kind = "signal " if element.tag == "signal" else ""
    lines = [f"### {kind}{element.get('name')} ({escaped(signature)})", ""]
    for text in texts:
        lines += [escaped(text), ""]
    remarks = [name.get("name") for name in element.findall("arg") if name.get("name") in arguments]
    lines += [f"- **{escaped(str(name))}**: {escaped(arguments[str(name)])}" for name in remarks]
    return [*lines, ""] if remarks else lines


def interfaces() -> str:
    lines = []
    for path in sorted(INTERFACES.glob("*.xml")):
        text = path.read_text()
        notes = comments(text)
        interface = ElementTree.fromstring(text).find("interface")
        assert interface is not None
        name = interface.get("name", "")
        lines += [f"# {name.upper()}", ""]
        about, texts = paragraphs(notes.get(name, ""))
        for words in filter(None, [about.get("short_description"), *texts]):
            lines += [escaped(words), ""]
        for element in interface:
            lines += member(element, notes)
    return "\n".join(lines)


def documents(printer: str) -> dict[Path, str]:
    doc = REPOSITORY / "doc"
    conf, settings, dbus = (
        doc / name for name in ("portd-conf.xml.5.md", "portd.conf.5.md", "portd-dbus.7.md")
    )
    return {
        conf: filled(conf.read_text(), "vocabulary", printed(printer, "markdown")),
        settings: filled(settings.read_text(), "settings", printed(printer, "settings")),
        dbus: filled(dbus.read_text(), "interfaces", interfaces()),
        REPOSITORY / "data/schema/portd-conf.rng": printed(printer, "schema"),
    }


def main() -> int:
    check = sys.argv[1] == "--check"
    stale = []
    for path, text in documents(sys.argv[-1]).items():
        if not path.exists() or path.read_text() != text:
            stale.append(path.relative_to(REPOSITORY))
            if not check:
                path.write_text(text)
    for path in stale:
        print(path, "is out of date: run ninja update-documents" if check else "written")
    return 1 if check and stale else 0


if __name__ == "__main__":
    sys.exit(main())
