#!/usr/bin/env python3
"""The layer check fails on an include that points up: each case plants one
include in a copy of the tree and expects the check to name it.

    tests/layers/check_layers_test.py SOURCE_DIR
"""

import os
import shutil
import subprocess
import sys
import tempfile
import unittest

SOURCE = os.path.abspath(sys.argv.pop(1)) if len(sys.argv) > 1 else os.getcwd()
CHECKED = ["include", "src", "tools", "runners", "sdk", "scripts"]

# (file that gets the include, the include, what the report must say)
PLANTS = [
    ("src/foundation/errors.cc", "#include <hoxcm/drift.h>",
     "src/foundation/errors.cc:1: foundation includes <hoxcm/drift.h> of the layer above, drift"),
    ("src/platform/paths.cc", '#include "extraction/extraction_internal.h"',
     'src/platform/paths.cc:1: platform includes "extraction/extraction_internal.h" of the layer above, extraction'),
    ("include/hoxcm/json.h", "#include <hoxcm/files.h>",
     "include/hoxcm/json.h:1: foundation includes <hoxcm/files.h> of the layer above, platform"),
    ("tools/hoxcfg/main.cc", '#include "platform/file_descriptor.h"',
     'tools/hoxcfg/main.cc:1: apps includes "platform/file_descriptor.h": programs use the public headers only'),
]


def run_check(root):
    return subprocess.run([sys.executable, os.path.join(root, "scripts/check-layers.py"), "--root", root],
                          stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True)


class CheckLayersTest(unittest.TestCase):
    def test_the_tree_passes_and_every_planted_upward_include_fails_it(self):
        with tempfile.TemporaryDirectory() as copy:
            for top in CHECKED:
                shutil.copytree(os.path.join(SOURCE, top), os.path.join(copy, top),
                                ignore=shutil.ignore_patterns("__pycache__"))
            clean = run_check(copy)
            self.assertEqual(clean.returncode, 0, clean.stdout)
            for path, include, report in PLANTS:
                with self.subTest(path=path):
                    target = os.path.join(copy, path)
                    with open(target) as f:
                        original = f.read()
                    with open(target, "w") as f:
                        f.write(include + "\n" + original)
                    planted = run_check(copy)
                    with open(target, "w") as f:
                        f.write(original)
                    self.assertEqual(planted.returncode, 1, planted.stdout)
                    self.assertIn(report, planted.stdout.splitlines())


if __name__ == "__main__":
    unittest.main()
