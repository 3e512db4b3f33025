"""The quorlet daemon switch: the configuration store is the only place this setting lives, so
applying it needs no work here; the runner stores the applied values."""


def apply(request, host):
    return None
