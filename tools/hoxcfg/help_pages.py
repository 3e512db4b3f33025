#!/usr/bin/env python3
"""Man pages and bash completion for hoxcfg, made from what `hoxcfg --help`
prints (the help text lives in the program; nothing here repeats it).

    help_pages.py HOXCFG --man DIR --completion FILE --version VERSION

walks the command tree from `HOXCFG --help` through each "Commands:" list and
writes DIR/hoxcfg.1.gz, DIR/hoxcfg-COMMAND[-SUB].1.gz and the bash completion
script FILE.
"""

import argparse
import gzip
import os
import re
import subprocess
import sys

# Help lines: "  TERM    DESCRIPTION" (an entry) or a deeper-indented
# continuation of the entry above.
ENTRY = re.compile(r"^  (\S.*?)(?:\s{2,}(\S.*))?$")
CONTINUATION = re.compile(r"^\s{6,}(\S.*)$")
CHOICES = re.compile(r":\{([^}]*)\}")
# A positional is an item of the host when its help names the three levels.
ITEM_WORDS = "COMPONENT/GROUP/KEY"


class Command:
    def __init__(self, path, help_text):
        self.path = path  # ["maintenance", "enter"]; [] for hoxcfg itself
        self.summary = ""
        self.usage = ""
        self.sections = []  # [(title, [(term, description)] or [text])]
        self._parse(help_text)

    def _parse(self, text):
        lines = text.rstrip("\n").split("\n")
        self.summary = lines[0].strip()
        title, entries = None, None
        for line in lines[1:]:
            if line.startswith("Usage: "):
                self.usage = line[len("Usage: "):]
            elif line and not line.startswith(" ") and line.endswith(":") or line.startswith("Global options ("):
                title, entries = line.rstrip(":"), []
                self.sections.append((title, entries))
            elif entries is None or not line.strip():
                continue
            elif CONTINUATION.match(line) and entries:
                term, description = entries[-1]
                text_more = CONTINUATION.match(line).group(1)
                entries[-1] = (term, (description + " " + text_more).strip())
            else:
                match = ENTRY.match(line)
                entries.append((match.group(1).strip(), (match.group(2) or "").strip()))

    def section(self, title):
        for name, entries in self.sections:
            if name == title or name.startswith(title + " "):
                return entries
        return []

    @property
    def name(self):
        return "-".join(["hoxcfg"] + self.path)

    @property
    def subcommands(self):
        return [term.split()[0] for term, _ in self.section("Commands")]


def read_tree(hoxcfg):
    env = {k: v for k, v in os.environ.items() if not k.startswith("HOX_")}
    env["COLUMNS"] = "80"
    commands, pending = [], [[]]
    while pending:
        path = pending.pop(0)
        out = subprocess.run([hoxcfg] + path + ["--help"], check=True, capture_output=True, text=True, env=env).stdout
        command = Command(path, out)
        commands.append(command)
        pending.extend(path + [sub] for sub in command.subcommands)
    return commands


# ---- Man pages -----------------------------------------------------------


def roff(text):
    text = text.replace("\\", "\\e").replace("-", "\\-")
    return "\\&" + text if text[:1] in (".", "'") else text


def man_page(command, commands, version):
    title = command.name.upper()
    out = [
        '.TH "%s" 1 "" "hoxcm %s" "hoxcm manual"' % (title, version),
        ".SH NAME",
        "%s \\- %s" % (roff(command.name), roff(command.summary)),
        ".SH SYNOPSIS",
        ".B %s" % roff(" ".join(["hoxcfg"] + command.path)),
        roff(command.usage.split(" ", 1 + len(command.path))[-1]),
        ".SH DESCRIPTION",
        roff(command.summary) + ".",
    ]
    for title_text, entries in command.sections:
        out.append('.SH "%s"' % roff(title_text.split(" (")[0].upper()))
        for term, description in entries:
            if description:
                out += [".TP", ".B %s" % roff(term), roff(description)]
            else:
                out += [".PP", roff(term)]
    related = ["hoxcfg"] if command.path else []
    related += [c.name for c in commands if c.path[:-1] == command.path and c.path]
    if related:
        out.append(".SH \"SEE ALSO\"")
        out.append(",\n".join(".BR %s (1)" % roff(name) for name in related))
    return "\n".join(out) + "\n"


def write_man(commands, directory, version):
    os.makedirs(directory, exist_ok=True)
    for name in os.listdir(directory):
        if name.endswith(".1.gz"):
            os.remove(os.path.join(directory, name))
    for command in commands:
        path = os.path.join(directory, command.name + ".1.gz")
        with open(path, "wb") as raw, gzip.GzipFile(filename="", mode="wb", fileobj=raw, mtime=0, compresslevel=9) as out:
            out.write(man_page(command, commands, version).encode())


# ---- Bash completion -----------------------------------------------------


def option_words(term):
    """('-y,--yes', 'DIR', '{a,b}'): the spellings of an option, its value, its choices."""
    term = re.sub(r"\s*\(Env:[^)]*\)", "", term)
    spelling, _, value = term.partition(" ")
    choices = CHOICES.search(value)
    return spelling.split(","), value.split(":")[0].strip(), choices.group(1).split(",") if choices else []


def positional_kind(term, description):
    choices = CHOICES.search(term)
    if choices:
        return "choices:" + " ".join(choices.group(1).split(","))
    if ITEM_WORDS in description:
        return "item"
    return "file"


def bash_quote(text):
    return "'" + text.replace("'", "'\\''") + "'"


def completion_script(commands):
    subs, options, positionals, values = {}, {}, {}, {}
    for command in commands:
        key = " ".join(["hoxcfg"] + command.path)  # bash refuses an empty key
        subs[key] = " ".join(command.subcommands)
        words = []
        for title in ("Options", "Global options"):
            for term, _ in command.section(title):
                for part in term.split(", "):
                    spellings, value, choices = option_words(part)
                    words += spellings
                    for spelling in spellings:
                        if value:
                            values[spelling] = "choices:" + " ".join(choices) if choices else (
                                "dir" if value == "DIR" else "file")
                        elif spelling not in values:
                            values[spelling] = ""
        options[key] = " ".join(dict.fromkeys(words))
        kinds = [positional_kind(term, description) for term, description in command.section("Positionals")]
        if kinds:
            positionals[key] = kinds[0]

    def table(name, entries):
        rows = "\n".join("  [%s]=%s" % (bash_quote(k), bash_quote(v)) for k, v in sorted(entries.items()))
        return "declare -gA %s=(\n%s\n)" % (name, rows)

    return "\n".join([
        "# bash completion for hoxcfg: subcommands, options and their values, and",
        "# COMPONENT/GROUP/KEY items from the schemas installed under the root.",
        "# Generated from hoxcfg --help when hoxcm is built.",
        table("_hoxcfg_subcommands", subs),
        table("_hoxcfg_options", options),
        table("_hoxcfg_positionals", positionals),
        table("_hoxcfg_option_values", {k: v for k, v in values.items() if v}),
        COMPLETION_FUNCTIONS,
    ])


COMPLETION_FUNCTIONS = r'''
# The installed keys as COMPONENT/GROUP/KEY, read by hoxcfg from the schemas
# under the root the command line names (--root), else HOX_ROOT.
_hoxcfg_items() {
  local root=$1
  "${_hoxcfg_program:-hoxcfg}" ${root:+--root "$root"} schemas --json --compact 2>/dev/null |
    grep -o '"item":"[^"]*"' | sed -e 's/^"item":"\///' -e 's/"$//'
}

_hoxcfg() {
  local cur=${COMP_WORDS[COMP_CWORD]} prev=${COMP_WORDS[COMP_CWORD-1]}
  local path=hoxcfg root="" i word kind
  # The command named so far: the words that are subcommands of the one
  # before; options and their values are skipped.
  for ((i = 1; i < COMP_CWORD; i++)); do
    word=${COMP_WORDS[i]}
    if [[ $word == -* ]]; then
      if [[ -n ${_hoxcfg_option_values[$word]:-} ]]; then
        ((i++))
        [[ $word == --root ]] && root=${COMP_WORDS[i]}
      fi
    elif [[ " ${_hoxcfg_subcommands[$path]} " == *" $word "* ]]; then
      path="$path $word"
    fi
  done
  COMPREPLY=()
  kind=${_hoxcfg_option_values[$prev]:-}
  if [[ -n $kind && $prev == -* ]]; then
    case $kind in
      dir) COMPREPLY=($(compgen -d -- "$cur")) ;;
      choices:*) COMPREPLY=($(compgen -W "${kind#choices:}" -- "$cur")) ;;
      *) COMPREPLY=($(compgen -f -- "$cur")) ;;
    esac
    return 0
  fi
  if [[ $cur == -* ]]; then
    COMPREPLY=($(compgen -W "${_hoxcfg_options[$path]}" -- "$cur"))
    return 0
  fi
  if [[ -n ${_hoxcfg_subcommands[$path]} ]]; then
    COMPREPLY=($(compgen -W "${_hoxcfg_subcommands[$path]}" -- "$cur"))
    return 0
  fi
  kind=${_hoxcfg_positionals[$path]:-}
  case $kind in
    item)
      local items
      items=$(_hoxcfg_items "$root")
      [[ $cur == /* ]] && items=$(printf '%s\n' $items | sed 's/^/\//')
      COMPREPLY=($(compgen -W "$items" -- "$cur"))
      ;;
    choices:*) COMPREPLY=($(compgen -W "${kind#choices:}" -- "$cur")) ;;
    file) COMPREPLY=($(compgen -f -- "$cur")) ;;
  esac
  return 0
}
complete -F _hoxcfg hoxcfg
'''


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("hoxcfg")
    parser.add_argument("--man", required=True, help="directory of the man pages")
    parser.add_argument("--completion", required=True, help="the bash completion script")
    parser.add_argument("--version", required=True)
    args = parser.parse_args()
    commands = read_tree(args.hoxcfg)
    write_man(commands, args.man, args.version)
    os.makedirs(os.path.dirname(os.path.abspath(args.completion)), exist_ok=True)
    with open(args.completion, "w") as out:
        out.write(completion_script(commands))
    return 0


if __name__ == "__main__":
    sys.exit(main())
