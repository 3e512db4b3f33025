"""NTP: writes /etc/ntp.conf from services/time/ntp."""


def apply(request, host):
    for item in host.items(request):
        if item["operation"] == "DELETE":
            host.remove_file("/etc/ntp.conf")
            continue
        config = item["config"]
        lines = ["# written by the ntp plugin\n"]
        if config.get("enabled", False):
            lines += ["server %s iburst\n" % s for s in config.get("servers", [])]
        else:
            lines.append("# disabled\n")
        host.write_file("/etc/ntp.conf", "".join(lines))
    return None
