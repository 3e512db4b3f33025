"""The Python half of the runner conformance suite: behaves exactly like
conformance_plugin.cc."""

import os

FAILED = {"id": "conformance.failed", "args": ["a1"], "message": "failed on purpose"}


def _items(request, host):
    items = host.items(request)
    behaviour = "ok"
    if items and isinstance(items[0]["config"], dict):
        behaviour = items[0]["config"].get("behaviour", "ok")
    if behaviour == "throw":
        raise RuntimeError("thrown on purpose with %s" % items[0]["config"])
    return items, behaviour


def apply(request, host):
    items, behaviour = _items(request, host)
    if behaviour != "ok":
        return FAILED if behaviour == "fail" else "not json"
    with open(os.path.join(host.root, "applied"), "w") as f:
        f.write("%d\n" % len(items))
    return None


def impact(request, host):
    items, behaviour = _items(request, host)
    if behaviour != "ok":
        return {"error": dict(FAILED, args=[], message="m")} if behaviour == "fail" else "not json"
    return [{"impact": i["config"].get("impact", 0), "component": i["component"], "group": i["group"],
             "key": i["key"], "reason": "r"} for i in items]


def validate(request, host):
    items, behaviour = _items(request, host)
    if behaviour == "garbage":
        return "not json"
    return [{"field": "/%s/%s/%s/bad" % (i["component"], i["group"], i["key"]),
             "errors": [{"id": "conformance.bad", "args": ["x"], "message": "bad"}]}
            for i in items if "bad" in i["config"]]
