"""Kernel boot options: writes /etc/tarvik/boot-options.conf, read by the
boot loader at the next boot."""


def apply(request, host):
    for item in host.items(request):
        if item["operation"] == "DELETE":
            host.remove_file("/etc/tarvik/boot-options.conf")
            continue
        config = item["config"]
        lines = []
        for name in sorted(config):
            value = config[name]
            if isinstance(value, bool):
                value = "TRUE" if value else "FALSE"
            lines.append("%s=%s\n" % (name, value))
        host.write_file("/etc/tarvik/boot-options.conf", "".join(lines))
    return None
