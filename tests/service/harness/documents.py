"""Hardware descriptions as text, for tests that don't care about the document's finer points."""

from typing import Mapping, Optional
from xml.sax.saxutils import quoteattr


def _attributes(pairs: Mapping[str, str]) -> str:
    return "".join(f" {key}={quoteattr(value)}" for key, value in pairs.items())


def port(
    name: str,
    number: Optional[int | str],
    kind: str = "input",
    backend: Optional[str] = "check",
    flags: str = "ioport",
    device: Optional[Mapping[str, str]] = None,
    names: Optional[Mapping[str, str]] = None,
    optional: bool = False,
    hwid: Optional[str] = None,
    extra: str = "",
) -> str:
    """One port element. `device` fills the backend's "device" section, `extra` ends the port."""
    head = {} if hwid is None else {"hwid": hwid}
    head["name"] = name
    if optional:
        head["optional"] = "true"
    lines = [f"<port{_attributes(head)}>", f'<port_type type="{kind}"/>']
    if number is not None:
        lines.append(f'<port_no nbr="{number}"/>')
    if flags:
        lines.append(f"<properties{_attributes({flag: 'true' for flag in flags.split()})}/>")
    if names:
        lines.append(f"<param_default_name{_attributes(names)}/>")
    if backend is not None:
        section = f"<device{_attributes(device)}/>" if device else ""
        lines.append(f'<backend name="{backend}">{section}</backend>')
    return "\n  ".join([*lines, extra]) + "\n</port>"


def hwdesc(*ports: str) -> str:
    """A whole document of the given ports."""
    return "<ports>\n" + "\n".join(ports) + "\n</ports>\n"
