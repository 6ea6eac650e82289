#!/usr/bin/env python3
"""Writes the shell completions of halyardctl, made of what it says of itself, so that they
know every command and option that it has.

usage: generate.py HALYARDCTL FOLDER    writes FOLDER/halyardctl (bash) and FOLDER/_halyardctl (zsh)
"""

import os
import re
import subprocess
import sys

OPTION = re.compile(r"  (?:(-\w),)?(--[\w-]+)(?: (\S+))?(?: REQUIRED)?(?: \.\.\.)?(?:\s+(\S.*))?$")
CHOICES = re.compile(r"((?:\w+, )*\w+) or (\w+)$")


class Option:
    def __init__(self, short, name, value, text):
        self.short, self.name, self.value, self.text = short, name, value, text or ""

    def names(self):
        return ([self.short] if self.short else []) + [self.name]

    def choices(self):
        """The words that it takes, when its help lists them in small letters."""
        words = (self.value or "").split("|")
        return words if len(words) > 1 and all(word.islower() for word in words) else []

    def kind(self):
        """What stands behind it: nothing, words, dirs, files, or something else."""
        if not self.value:
            return "nothing"
        if self.choices():
            return "words"
        if self.value == "DIR":
            return "dirs"
        return "files" if re.match("FILE|PATH", self.value) else "something"


class Help:
    """What `halyardctl [COMMAND] --help` shows."""

    def __init__(self, program, command=None):
        arguments = [program] + ([command] if command else []) + ["--help"]
        text = subprocess.run(arguments, check=True, capture_output=True, text=True).stdout
        self.options, self.commands, self.words, self.takes_file = [], [], [], False
        section = None
        for line in text.splitlines():
            if line.endswith(":") and not line.startswith(" "):
                section = line[:-1]
            elif section == "Options" and (found := OPTION.match(line)):
                self.options.append(Option(*found.groups()))
            elif section == "Subcommands" and (found := re.match(r"  (\w+)\s+(.*)", line)):
                self.commands.append(found.groups())
            elif section == "Positionals":
                self.read_positional(line)

    def read_positional(self, line):
        self.takes_file |= line.startswith("  FILE")
        choices = CHOICES.search(re.sub(r"^  \S+\s+", "", line))
        if choices:
            self.words = choices[1].split(", ") + [choices[2]]


def bash_of(command, options, words, takes_file):
    names = " ".join(name for option in options for name in option.names())
    lines = [f"    {command})", f'        options="{names}"']
    if words:
        lines.append(f'        words="{" ".join(words)}"')
    if takes_file:
        lines.append("        words=files")
    return lines + ["        ;;"]


def bash(top, commands):
    lines = ["# bash completion for halyardctl; made of its help.", "_halyardctl()", "{",
             '    local current="${COMP_WORDS[COMP_CWORD]}" previous="${COMP_WORDS[COMP_CWORD - 1]}"',
             '    local word command="" skip="" options words=""',
             '    for word in "${COMP_WORDS[@]:1:COMP_CWORD - 1}"; do',
             '        if [[ -n $skip ]]; then', '            skip=""', '            continue',
             '        fi', '        case $word in']
    valued = [option.name for option in top.options if option.kind() != "nothing"]
    lines += [f"        {' | '.join(valued)}) skip=yes ;;", "        -*) ;;",
              '        *) command=$word; break ;;', "        esac", "    done",
              '    case $command in']
    names = [name for name, _ in top.commands]
    lines += bash_of('""', top.options, names, False)
    for name, shown in commands:
        lines += bash_of(name, shown.options + top.options[1:], shown.words, shown.takes_file)
    lines += ["    *) return ;;", "    esac", "    local kind=", "    case $command/$previous in"]
    for name, shown in [("*", top)] + commands:
        for option in shown.options:
            kind = "" if option.kind() == "nothing" else option.kind()
            if option.kind() == "words":
                kind = f'"{" ".join(option.choices())}"'
            if kind:
                lines.append(f"    {name}/{option.name}) kind={kind} ;;")
    lines += ["    esac",
              '    [[ -z $kind && $current == -* ]] && kind=$options',
              '    kind=${kind:-$words}',
              "    case $kind in",
              '    dirs) mapfile -t COMPREPLY < <(compgen -d -- "$current") ;;',
              '    files) mapfile -t COMPREPLY < <(compgen -f -- "$current") ;;',
              '    something) COMPREPLY=() ;;',
              '    *) mapfile -t COMPREPLY < <(compgen -W "$kind" -- "$current") ;;',
              "    esac", "}", "complete -o filenames -F _halyardctl halyardctl", ""]
    return "\n".join(lines)


def quoted(text):
    return "'" + text.replace("'", "'\\''") + "'"


def zsh_option(option):
    text = re.sub(r"([\[\]:\\])", r"\\\1", option.text)
    action = {"nothing": "", "words": f":{option.name[2:]}:({' '.join(option.choices())})",
              "dirs": ":folder:_files -/", "files": ":file:_files",
              "something": f":{re.sub(':', '', option.value or '')}:"}[option.kind()]
    several = "*" if option.name == "--session" else ""
    return [quoted(f"{several}{name}[{text}]{action}") for name in option.names()]


def zsh(top, commands):
    everywhere = [text for option in top.options for text in zsh_option(option)]
    lines = ["#compdef halyardctl", "# zsh completion for halyardctl; made of its help.", "",
             "local context state line", "local -a commands everywhere", "commands=("]
    lines += [f"  {quoted(name + ':' + text)}" for name, text in top.commands]
    lines += [")", "everywhere=("] + [f"  {text}" for text in everywhere] + [")", "",
              "_arguments -C $everywhere '1: :->command' '*:: :->rest' && return", "",
              "case $state in", "command) _describe command commands ;;", "rest)",
              "  case $words[1] in"]
    for name, shown in commands:
        known = {option.name for option in top.options}
        own = [text for option in shown.options if option.name not in known
               for text in zsh_option(option)]
        if shown.words:
            own.append(quoted(f"1:kind:({' '.join(shown.words)})"))
        if shown.takes_file:
            own.append(quoted("1:file:_files"))
        lines.append(f"  {name}) _arguments $everywhere {' '.join(own)} ;;")
    lines += ["  esac", "  ;;", "esac", ""]
    return "\n".join(lines)


def main(arguments):
    program, folder = arguments
    top = Help(program)
    commands = [(name, Help(program, name)) for name, _ in top.commands]
    for name, text in ("halyardctl", bash(top, commands)), ("_halyardctl", zsh(top, commands)):
        with open(os.path.join(folder, name), "w", encoding="utf-8") as file:
            file.write(text)


if __name__ == "__main__":
    main(sys.argv[1:])
