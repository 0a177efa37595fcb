#!/usr/bin/env python3
"""Doxygen input filter: reads a public header's plain // comments as
documentation, so the headers keep one comment style.

- The comment that opens the header documents the file.
- A comment block right before a declaration documents it (one followed by
  a blank line stays a plain comment); a comment after
  code on the same line documents that line's member.
- A comment over several declarations with no blank line between them
  documents each of them (a Doxygen member group), as does a comment over
  one declaration of several names (int a = 1, b = 2;). Such a group ends
  at the closing brace of a member's body.
- Lines indented by two or more spaces inside a comment (usage samples,
  tables) are kept as preformatted code.
Everything else passes through unchanged. The commands it adds take lines
of their own, so a warning's line number may be a few lines past the one in
the header.
"""
import re
import sys


def convert_block(block, indent, first_line_prefix=""):
    out = []
    in_code = False
    for text in block:
        body = text[2:] if text.startswith("  ") else None
        is_code = text.startswith("  ") and text.strip() != ""
        if is_code and not in_code:
            out.append(f"{indent}/// \\code{{.unparsed}}")
            in_code = True
        elif not is_code and in_code and text.strip() != "":
            out.append(f"{indent}/// \\endcode")
            in_code = False
        out.append(f"{indent}/// {text if is_code else escape_tags(text)}".rstrip())
    if in_code:
        out.append(f"{indent}/// \\endcode")
    if first_line_prefix:
        out.insert(0, f"{indent}/// {first_line_prefix}")
    return out


def starts_declaration(line, indent):
    return (line.startswith(indent) and len(line) > len(indent) and not line[len(indent)].isspace()
            and not line.lstrip().startswith(("}", "//", "#", "public:", "protected:", "private:")))


def declares_several(lines, start, end):
    """Whether the one declaration in lines[start:end] names several
    variables (int a = 1, b = 2;): a comma outside brackets before the ";"
    and no parenthesis before the first "=" (not a function)."""
    joined = " ".join(line.strip() for line in lines[start:end])
    text = joined.split(";")[0]
    if ";" not in joined or text.startswith("template") or "(" in text.split("=")[0]:
        return False  # an enumerator, a template, a function
    depth = 0
    for ch in text:
        if ch == "{" and depth == 0:  # a class, an enum, a braced initializer
            return False
        if ch in "([{<":
            depth += 1
        elif ch in ")]}>":
            depth -= 1
        elif ch == "," and depth == 0:
            return True
    return False


def group_end(lines, start, indent):
    """The end of the lines after a comment that it speaks for: up to a blank
    line, a comment, or a line indented less than the comment."""
    k = start
    while k < len(lines):
        line = lines[k]
        if not line.strip() or line.lstrip().startswith("//"):
            break
        if not line.startswith(indent) or (len(line) - len(line.lstrip()) < len(indent)):
            break
        if line.lstrip().startswith(("public:", "protected:", "private:", "}")) \
                and len(line) - len(line.lstrip()) <= len(indent):
            break
        k += 1
    return k


CLASS = re.compile(r"^(?:class|struct)\s+(?:KIVI_EXPORT\s+)?(\w+)\b[^;]*$")


def principal_class(lines):
    """The class the header's opening comment introduces by name in its
    first line, when that class has no comment of its own: its line index."""
    if not lines or not lines[0].startswith("//"):
        return None
    named = set(re.findall(r"\w+", lines[0]))
    for k, line in enumerate(lines):
        m = CLASS.match(line)
        if m and m.group(1) in named and k > 0 and not lines[k - 1].lstrip().startswith("//") \
                and not lines[k - 1].startswith("template"):
            return k
    return None


def escape_tags(text):
    """Keeps <pid>, <dir> and the like as text outside `code spans`."""
    parts = text.split("`")
    for n in range(0, len(parts), 2):
        parts[n] = re.sub(r"<(?=[A-Za-z/])", r"\\<", parts[n])
    return "`".join(parts)


def main():
    path = sys.argv[1]
    lines = open(path, encoding="utf-8").read().split("\n")
    principal = principal_class(lines)
    opening = []
    out = []
    i = 0
    seen_code = False
    while i < len(lines):
        line = lines[i]
        m = re.match(r"^(\s*)//(?!/)(.*)$", line)
        if m:
            indent = m.group(1)
            block = []
            while i < len(lines):
                mm = re.match(r"^(\s*)//(?!/) ?(.*)$", lines[i])
                if not mm or mm.group(1) != indent:
                    break
                block.append(mm.group(2))
                i += 1
            following = lines[i] if i < len(lines) else ""
            if not seen_code and principal is not None:
                # The opening comment is the principal class's documentation.
                opening = convert_block(block, indent)
                out.append("/// \\file")
            elif not seen_code:  # the header's opening comment
                out.extend(convert_block(block, indent, "\\file"))
            elif following.strip() and (not following.lstrip().startswith("#")
                                        or following.lstrip().startswith("#define")):
                end = group_end(lines, i, indent)
                declarations = sum(1 for k in range(i, end) if starts_declaration(lines[k], indent))
                if declarations > 1 or (declarations == 1 and declares_several(lines, i, end)):
                    out.append(f"{indent}///@{{")
                    out.extend(convert_block(block, indent))
                    out.extend(lines[i:end])
                    out.append(f"{indent}///@}}")
                    i = end
                else:
                    out.extend(convert_block(block, indent))
            else:  # a heading or a note that documents nothing
                out.extend(f"{indent}// {text}".rstrip() for text in block)
            seen_code = True
            continue
        trailing = re.match(r"^(\s*\S.*?;)(\s+)//(?!/) ?(.*)$", line)
        if trailing and '"' not in trailing.group(1).split(";")[-1]:
            line = f"{trailing.group(1)}{trailing.group(2)}///< {trailing.group(3)}"
        if line.strip():
            seen_code = True
        if i == principal:
            out.extend(opening)
        out.append(line)
        i += 1
    sys.stdout.write("\n".join(out))


if __name__ == "__main__":
    main()
