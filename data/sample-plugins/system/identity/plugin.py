"""Host name: writes /etc/hostname and checks host name syntax."""

import re

_LABEL = re.compile(r"^(?!-)[A-Za-z0-9-]{1,63}(?<!-)$")


def _valid_name(name):
    return isinstance(name, str) and 0 < len(name) <= 253 and all(_LABEL.match(p) for p in name.split("."))


def apply(request, host):
    for item in host.items(request):
        if item["key"] != "hostname":
            continue
        if item["operation"] == "DELETE":
            host.remove_file("/etc/hostname")
            continue
        config = item["config"]
        name = config.get("hostname", "")
        domain = config.get("domain", "")
        host.write_file("/etc/hostname", (name + "." + domain if domain else name) + "\n")
    return None


def validate(request, host):
    findings = []
    for item in host.items(request):
        config = item["config"] if isinstance(item["config"], dict) else {}
        for member in ("hostname", "domain"):
            value = config.get(member)
            if value is None or (member == "domain" and value == ""):
                continue
            if not _valid_name(value):
                findings.append({"field": "/system/identity/hostname/" + member,
                                 "errors": [{"id": "com.tarvik.hox.settings.system.identity.invalid-name",
                                             "args": [str(value)],
                                             "message": "not a valid host name: %s" % value}]})
    return findings
