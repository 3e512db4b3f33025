#!/usr/bin/env python3
"""Checks that the layers of hoxcm include one way only: each file includes
only files of its own layer and of the layers below it.

    scripts/check-layers.py [--root DIR]

Layers, bottom to top (docs/architecture.md explains them):

    foundation  src/foundation/   pure JSON and C++: errors, parser, task,
                                  document utilities and shape, comparison
    platform    src/platform/     the operating system: files, processes,
                                  store, schema store and validator, host
                                  facts, logger, fixed paths
    extraction  src/extraction/   host documents from the store
    drift       src/drift/        the drift walk and its handlers
    plugins     src/plugins/      manifests, registry, requests, results, runs
    workflow    src/workflow/     the operations built on drift and plugins
    apps        tools/ runners/ sdk/   hoxcfg, the runners, sample plugins

Public headers belong to the layer of what they declare (PUBLIC_HEADERS
below); a new one must be given its layer here. Public headers include no
file of src/, and the apps use only the public headers and their own files.
Prints one line per violation and exits 1 when there is any. Python 3,
standard library only.
"""

import argparse
import os
import re
import sys

LAYERS = ["foundation", "platform", "extraction", "drift", "plugins", "workflow", "apps"]

# Source directories and the layer of every file below them.
DIRECTORIES = {
    "src/foundation/": "foundation",
    "src/platform/": "platform",
    "src/extraction/": "extraction",
    "src/drift/": "drift",
    "src/plugins/": "plugins",
    "src/workflow/": "workflow",
    "tools/": "apps",
    "runners/": "apps",
    "sdk/": "apps",
}

PUBLIC_HEADERS = {
    "export.h": "foundation",
    "errors.h": "foundation",
    "json.h": "foundation",
    "task.h": "foundation",
    "documents.h": "foundation",
    "config_document.h": "foundation",
    "config_store.h": "platform",
    "schema_store.h": "platform",
    "host.h": "platform",
    "files.h": "platform",
    "host_documents.h": "platform",
    "extraction.h": "extraction",
    "drift.h": "drift",
    "plugins.h": "plugins",
    "plugin_sdk.h": "plugins",
    "operations.h": "workflow",
    "boot.h": "workflow",
    "host_api.h": "workflow",
}

SOURCE_SUFFIXES = (".h", ".hpp", ".cc", ".cpp", ".c")
INCLUDE = re.compile(r'^\s*#\s*include\s*([<"])([^>"]+)[>"]')
# The apps' own include directories, where their quoted includes are found.
APP_INCLUDE_DIRS = ["tools/"]


def layer_of(path):
    """The layer of a file given relative to the root, or None."""
    if path.startswith("include/hoxcm/"):
        return PUBLIC_HEADERS.get(path[len("include/hoxcm/"):])
    for prefix, layer in DIRECTORIES.items():
        if path.startswith(prefix):
            return layer
    return None


def files_to_check(root):
    for top in ["include/hoxcm"] + [d.rstrip("/") for d in DIRECTORIES]:
        base = os.path.join(root, top)
        for directory, _, names in os.walk(base):
            for name in sorted(names):
                if name.endswith(SOURCE_SUFFIXES):
                    yield os.path.relpath(os.path.join(directory, name), root)


def resolve(root, includer, bracket, name):
    """The included file relative to the root; None for an outside header
    (system, RapidJSON, ...); "" when a quoted include names no file."""
    if bracket == "<":
        return "include/" + name if name.startswith("hoxcm/") else None
    candidates = ["src/" + name, os.path.join(os.path.dirname(includer), name)]
    candidates += [d + name for d in APP_INCLUDE_DIRS]
    for candidate in candidates:
        if os.path.isfile(os.path.join(root, candidate)):
            return os.path.normpath(candidate)
    return ""


def check(root):
    problems = []
    for path in files_to_check(root):
        layer = layer_of(path)
        if layer is None:
            problems.append("%s: not in any layer (give it one in scripts/check-layers.py)" % path)
            continue
        with open(os.path.join(root, path), encoding="utf-8", errors="replace") as f:
            lines = f.readlines()
        for number, line in enumerate(lines, 1):
            match = INCLUDE.match(line)
            if not match:
                continue
            bracket, name = match.groups()
            shown = "<%s>" % name if bracket == "<" else '"%s"' % name
            target = resolve(root, path, bracket, name)
            if target is None:
                continue
            where = "%s:%d: %s" % (path, number, layer)
            if target == "":
                problems.append("%s includes %s, which names no file of the tree" % (where, shown))
                continue
            if not os.path.isfile(os.path.join(root, target)):
                problems.append("%s includes %s, which does not exist" % (where, shown))
                continue
            target_layer = layer_of(target)
            if target_layer is None:
                problems.append("%s includes %s, which is in no layer" % (where, shown))
            elif LAYERS.index(target_layer) > LAYERS.index(layer):
                problems.append("%s includes %s of the layer above, %s" % (where, shown, target_layer))
            elif path.startswith("include/") and not target.startswith("include/"):
                problems.append("%s: a public header includes %s, which is not public" % (where, shown))
            elif layer == "apps" and target.startswith("src/"):
                problems.append("%s includes %s: programs use the public headers only" % (where, shown))
    return problems


def main():
    parser = argparse.ArgumentParser(description="Checks that includes point down the layers.")
    parser.add_argument("--root", default=os.path.dirname(os.path.dirname(os.path.abspath(__file__))),
                        help="the source tree (default: the one this script is in)")
    args = parser.parse_args()
    problems = check(args.root)
    for problem in problems:
        print(problem)
    if problems:
        print("%d include(s) against the layers (docs/architecture.md)" % len(problems))
        return 1
    return 0


if __name__ == "__main__":
    sys.exit(main())
