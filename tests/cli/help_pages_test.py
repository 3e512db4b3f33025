#!/usr/bin/env python3
"""The man pages and the bash completion made from hoxcfg --help, against the
built hoxcfg: a page per command with its summary, usage and every option;
completion offering every subcommand and option each help lists, option
values, and the installed keys where a command takes an item.

    help_pages_test.py HOXCFG MAN_DIR COMPLETION
"""

import gzip
import json
import os
import re
import subprocess
import sys
import tempfile
import unittest

HOXCFG, MAN_DIR, COMPLETION = sys.argv[1:4]
ENV = {k: v for k, v in os.environ.items() if not k.startswith("HOX_")}


def hoxcfg(*args, root=None):
    env = dict(ENV, **({"HOX_ROOT": root} if root else {}))
    return subprocess.run([HOXCFG, *args], capture_output=True, text=True, env=env, check=True).stdout


def listed(help_text, title):
    """The first words of the entries under TITLE: in a help text."""
    match = re.search(r"^%s:\n((?: +\S.*\n?)*)" % re.escape(title), help_text, re.M)
    if not match:
        return []
    return [line.split()[0] for line in match.group(1).splitlines() if re.match(r"^  \S", line)]


def command_paths(path=()):
    yield path
    for sub in listed(hoxcfg(*path, "--help"), "Commands"):
        yield from command_paths(path + (sub,))


def complete(line, root=None):
    """What the completion offers for LINE (the cursor at its end)."""
    script = ('source "$1"; _hoxcfg_program="$2"; read -ra COMP_WORDS <<<"$3"; '
              '[[ $3 == *" " ]] && COMP_WORDS+=(""); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); '
              '_hoxcfg; printf "%s\\n" "${COMPREPLY[@]}"')
    env = dict(ENV, **({"HOX_ROOT": root} if root else {}))
    out = subprocess.run(["bash", "-c", script, "_", COMPLETION, HOXCFG, line], capture_output=True, text=True,
                         env=env, check=True)
    assert out.stderr == "", out.stderr
    return sorted(word for word in out.stdout.splitlines() if word)


def options_of(help_text):
    words = []
    for title in ("Options", "Global options"):
        for term in listed(help_text, title):
            words += [w for w in term.split(",") if w.startswith("-")]
    return words


class HelpPagesTest(unittest.TestCase):
    def test_every_command_has_a_man_page_made_from_its_help(self):
        # Given each command hoxcfg --help leads to, its page holds its summary,
        # its usage and each option its help lists.
        pages = set(os.listdir(MAN_DIR))
        for path in command_paths():
            with self.subTest(command=" ".join(path)):
                name = "-".join(("hoxcfg",) + path) + ".1.gz"
                self.assertIn(name, pages)
                pages.discard(name)
                with gzip.open(os.path.join(MAN_DIR, name), "rt") as page:
                    text = page.read().replace("\\-", "-").replace("\\&", "")
                help_text = hoxcfg(*path, "--help")
                self.assertIn(help_text.splitlines()[0], text)
                usage = help_text.split("Usage: ", 1)[1].splitlines()[0].split(" ", 1 + len(path))[-1]
                self.assertIn(usage, text)
                for option in options_of(help_text):
                    self.assertIn(option, text)
        self.assertEqual(pages, set(), "man pages of commands hoxcfg does not have")

    def test_completion_offers_what_each_help_lists(self):
        # Given a command line up to a command, completion offers its
        # subcommands (exactly those its help lists) and after "-" its options.
        for path in command_paths():
            with self.subTest(command=" ".join(path)):
                help_text = hoxcfg(*path, "--help")
                line = " ".join(("hoxcfg",) + path) + " "
                subcommands = listed(help_text, "Commands")
                if subcommands:
                    self.assertEqual(complete(line), sorted(subcommands))
                offered = complete(line + "-")
                for option in options_of(help_text):
                    self.assertIn(option, offered)
        # Options and their values are skipped on the way to the command.
        self.assertEqual(complete("hoxcfg --root /tmp -v --json maint"), ["maintenance"])
        self.assertEqual(complete("hoxcfg show "), ["current", "desired", "smartnic", "user"])
        self.assertIn("/tmp", complete("hoxcfg --root /tm"))

    def test_items_are_the_installed_keys_under_the_root(self):
        # Given a sample host, a command that takes COMPONENT/GROUP/KEY is
        # offered the keys of the installed schemas, under --root or HOX_ROOT.
        with tempfile.TemporaryDirectory() as root:
            hoxcfg("--root", root, "init", "--sample")
            keys = sorted(k["item"][1:] for k in json.loads(hoxcfg("--root", root, "--json", "schemas"))["keys"])
            self.assertIn("network/dns/config", keys)
            script = 'source "$1"; _hoxcfg_program="$2"; _hoxcfg_items "$3"'
            items = subprocess.run(["bash", "-c", script, "_", COMPLETION, HOXCFG, root], capture_output=True,
                                   text=True, env=ENV, check=True).stdout.split()
            self.assertEqual(sorted(items), keys)
            takes_item = [p for p in command_paths()
                          if "COMPONENT/GROUP/KEY" in hoxcfg(*p, "--help").split("Options:")[0]]
            for path in takes_item:
                with self.subTest(command=" ".join(path)):
                    line = " ".join(("hoxcfg",) + path) + " network/d"
                    self.assertEqual(complete("hoxcfg --root %s %s" % (root, line[7:])), ["network/dns/config"])
                    self.assertEqual(complete(line, root=root), ["network/dns/config"])


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1], verbosity=1)
