"""Port groups of the virtual switches: kept in the configuration store only.

Impact: the schema already asks for maintenance mode when a port group is
removed; a plugin is needed for what depends on which port group changes:
moving the management port group to another VLAN cuts the host's own
management connection, so it needs maintenance mode. Other VLAN changes do
not."""

MANAGEMENT = "Management Network"


def apply(request, host):
    return None


def impact(request, host):
    verdicts = []
    for item in host.items(request):
        config = item["config"] if isinstance(item["config"], dict) else {}
        drift = item.get("drift") if isinstance(item.get("drift"), dict) else {}
        retagged = item["operation"] == "SET" and "vlan" in drift and config.get("name") == MANAGEMENT
        verdicts.append({"impact": 1 if retagged else 0,
                         "component": item["component"], "group": item["group"], "key": item["key"],
                         "reason": "the management port group moves to VLAN %s: the host's management "
                                   "connection moves with it" % config.get("vlan") if retagged else ""})
    return verdicts
