# Shows Doxygen the headers' plain comments as documentation. The headers stay free of markup:
#   - a comment directly above a declaration is the declaration's, also of those that follow it
#     without a blank line and a comment of their own;
#   - a comment that stands alone belongs to the file;
#   - "name: text" at the start of a line is a parameter's (with -v parameters=1), "Returns" at the
#     start of a line begins what is returned;
#   - a comment behind a member is the member's.

function is_declaration(line) {
    return line !~ /^ *$/ && line !~ /^ *(#i|#e|extern "C"|namespace |}|\/\/)/ && line !~ /^ *(public|private):/
}

function emit(where,   i, text, indent, result) {
    result = where == "file" ? "/// @file\n" : ""
    for (i = 1; i <= lines; ++i) {
        text = block[i]
        if (text ~ /^ *\/\/ -+ *$/) {
            continue
        }
        sub(/^ *\/\//, "///", text)
        if (text !~ /^\/\/\/ {5}/) {
            gsub(/[\\%<]/, "\\\\&", text)
        }
        if (where == "declaration" && text ~ /^\/\/\/ Returns /) {
            sub(/Returns /, "@return ", text)
        }
        if (where == "declaration" && parameters && text ~ /^\/\/\/ [a-z][A-Za-z0-9]*(, [a-z][A-Za-z0-9]*)*: /) {
            sub(/\/\/\/ /, "/// @param ", text)
            while (text ~ /^\/\/\/ @param [A-Za-z0-9,]*, /) {
                sub(/, /, ",", text)
            }
            sub(/: /, " ", text)
        }
        result = result text "\n"
    }
    printf "%s", result
    return result
}

/^ *\/\// {
    block[++lines] = $0
    next
}

{
    if (lines > 0) {
        documentation = emit(is_declaration($0) ? "declaration" : "file")
        lines = 0
        whole = 1
    } else if (!is_declaration($0)) {
        # A blank line, or the end of what was opened.
        documentation = $0 ~ /^ *$/ ? "" : documentation
    } else if (whole && documentation != "" && depth == 0) {
        printf "%s", documentation
    }
    if ($0 !~ /^ *\/\// && $0 ~ /[^ ] +\/\/ /) {
        sub(/ +\/\/ /, " ///< ")
    }
    print
    whole = $0 ~ /; *(\/\/.*)?$/
}

END {
    if (lines > 0) {
        emit("file")
    }
}
