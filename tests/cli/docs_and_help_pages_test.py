#!/usr/bin/env python3
"""What is made from hoxcfg --help, against the built hoxcfg: docs/cli.md (a
section "## hoxcfg COMMAND" per command whose first text block is its help,
and JSON examples with the shape of what --json prints), a man page per
command with its summary, usage and every option, and bash completion
offering every subcommand and option each help lists, option values, and
the installed keys where a command takes an item.

    docs_and_help_pages_test.py HOXCFG MAN_DIR COMPLETION CLI_MD
"""

import gzip
import json
import os
import re
import subprocess
import sys
import tempfile
import unittest

HOXCFG, MAN_DIR, COMPLETION, CLI_MD = sys.argv[1:5]
ENV = {k: v for k, v in os.environ.items() if not k.startswith("HOX_")}


def hoxcfg(*args, root=None, check=True):
    env = dict(ENV, **({"HOX_ROOT": root} if root else {}))
    done = subprocess.run([HOXCFG, *args], capture_output=True, text=True, env=env, check=check)
    return done.stdout if check else done


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


def doc_sections():
    """docs/cli.md's sections by command ("" for hoxcfg itself): the first
    text block, and every JSON block."""
    sections, command, block = {}, None, None
    with open(CLI_MD, encoding="utf-8") as doc:
        for line in doc.read().splitlines():
            if block is not None:
                if line != "```":
                    block.append(line)
                elif command is not None:
                    text = "\n".join(block) + "\n"
                    if fence == "json":
                        sections[command]["json"].append(text)
                    elif fence == "text" and sections[command]["help"] is None:
                        sections[command]["help"] = text
                if line == "```":
                    block = None
            elif line.startswith("```"):
                fence, block = line[3:], []
            elif line.startswith("## "):
                command = line[10:] if line == "## hoxcfg" or line.startswith("## hoxcfg ") else None
                if command is not None:
                    sections[command] = {"help": None, "json": []}
    return sections


def kind(value):
    return {dict: "object", list: "array", str: "string", bool: "boolean", type(None): "null"}.get(type(value),
                                                                                                 "number")


def shape_faults(example, actual, path=""):
    """Faults of ACTUAL against the documented EXAMPLE: a member the example
    lacks, or a value of another kind. A member the output leaves out is
    optional ("error" only on failure); a documented null may be anything.
    The elements of an array are documented by those of every element of
    the example (a plugin's reason and a rule's differ), the first example
    of each member standing for it."""
    if example is None or actual is None:
        return []
    if kind(example) != kind(actual):
        return ["%s: %s, documented as %s" % (path, kind(actual), kind(example))]
    faults = []
    if isinstance(actual, dict):
        for name, value in actual.items():
            if name not in example:
                faults.append("%s/%s: not documented" % (path, name))
            else:
                faults += shape_faults(example[name], value, "%s/%s" % (path, name))
    elif isinstance(actual, list) and example:
        merged = {}
        for element in example:
            if not isinstance(element, dict):
                merged = element
                break
            for name, value in element.items():
                merged.setdefault(name, value)
        for i, element in enumerate(actual):
            faults += shape_faults(merged, element, "%s/%d" % (path, i))
    return faults


class DocsTest(unittest.TestCase):
    def test_every_command_is_documented_with_its_help_and_json_examples(self):
        sections = doc_sections()
        commands = [" ".join(path) for path in command_paths()]
        for command in commands:
            with self.subTest(command=command):
                self.assertIn(command, sections, 'docs/cli.md has no section "## hoxcfg %s"' % command)
                expected = hoxcfg(*command.split(), "--help").rstrip("\n") + "\n"
                self.assertEqual(sections[command]["help"], expected,
                                 'docs/cli.md, section "hoxcfg %s": its help block must read the help' % command)
                for example in sections[command]["json"]:
                    json.loads(example)
        self.assertEqual(sorted(sections), sorted(commands), "docs/cli.md documents a command hoxcfg does not have")

    def test_every_json_output_has_the_documented_shape(self):
        # Given the sample host and a desired document that adds a firewall
        # rule (maintenance mode), each command's --json output has the shape
        # of its documented example: its member names, and the kinds of their
        # values, at every depth.
        with tempfile.TemporaryDirectory() as root, tempfile.TemporaryDirectory() as fresh:
            hoxcfg("init", "--sample", root=root)
            document = json.loads(hoxcfg("export", root=root))
            document["profile"]["network"]["firewall"]["rules"].append(
                {"action": "allow", "name": "web", "port": 443, "protocol": "tcp"})
            files = {"desired": document, "value": {"mtu": 9},
                     "schema": {"type": "object", "properties": {"mtu": {"type": "integer", "minimum": 1280}}},
                     "syslog": {"remoteHost": "logs.example.com", "port": 514, "protocol": "udp"},
                     "smartnic": {"smartnic": {"ports": {"uplink": {"mtu": 9000}}}}}
            path = {name: os.path.join(root, name + ".json") for name in files}
            for name, content in files.items():
                with open(path[name], "w") as f:
                    json.dump(content, f)
            desired = path["desired"]
            # In order: what changes the host comes after what only reads it.
            runs = [("init", "--root %s init --sample" % fresh), ("schemas", "schemas"),
                    ("schema-check", "schema-check %s %s" % (path["schema"], path["value"])),
                    ("plugins list", "plugins list"), ("plugins check", "plugins check"),
                    ("compliance", "compliance " + desired), ("drift", "drift " + desired),
                    ("validate", "validate " + desired), ("impact", "impact " + desired), ("plan", "plan " + desired),
                    ("maintenance status", "maintenance status"), ("maintenance enter", "--yes maintenance enter"),
                    ("apply", "--yes apply " + desired), ("maintenance exit", "--yes maintenance exit"),
                    ("history", "history"), ("get", "get services/syslog/config"),
                    ("set", "--yes set services/syslog/config --file " + path["syslog"]),
                    ("delete", "--yes delete services/syslog/config"), ("bootstrap", "--yes bootstrap " + desired),
                    ("boot run", "--yes boot run"), ("boot complete", "--yes boot complete"),
                    ("boot status", "boot status"), ("smartnic set", "--yes smartnic set " + path["smartnic"])]
            sections = doc_sections()
            checked = set()
            for command, args in runs:
                with self.subTest(run="hoxcfg --json " + args):
                    done = hoxcfg("--json", *args.split(), root=root, check=False)
                    self.assertIn(done.returncode, (0, 1, 3), done.stderr)  # 3: staged
                    if not sections[command]["json"]:
                        continue  # a stream of events (apply), shown as text
                    checked.add(command)
                    faults = shape_faults(json.loads(sections[command]["json"][0]), json.loads(done.stdout))
                    self.assertEqual(faults, [], "docs/cli.md, hoxcfg " + command)
            for command, section in sections.items():
                if section["json"]:
                    self.assertIn(command, checked, "no run checks the JSON documented for hoxcfg %s" % command)


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
