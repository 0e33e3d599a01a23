# Writes a page's scdoc source with a Markdown text, the variable `text`, in the place of the line
# "@TEXT@". The text's title goes, and of Markdown it may have: sections, paragraphs, tables, lists of
# one level, indented literal text, and `code` and **bold** within lines.

# Words of a line: code becomes bold, and nothing else has a meaning to scdoc.
function words(line,    out, part, n, i, bold) {
    n = split(line, part, "`")
    out = ""
    for (i = 1; i <= n; ++i) {
        gsub(/\*\*/, "\001", part[i])
        gsub(/\\/, "\\\\", part[i])
        gsub(/[_*]/, "\\\\&", part[i])
        gsub(/\001/, "*", part[i])
        out = out (i % 2 == 0 ? "*" part[i] "*" : part[i])
    }
    return out
}

function end_literal() {
    if (literal) print "```"
    literal = 0
}

# The last column takes the room that there is.
function row(line, first,    cell, n, i) {
    sub(/^\| */, "", line)
    sub(/ *\|$/, "", line)
    n = split(line, cell, / *\| */)
    for (i = 1; i <= n; ++i) {
        gsub(/^ +| +$/, "", cell[i])
        print (i == 1 ? "|" : ":") (!first ? " " : i == n ? "<" : "[") \
            (cell[i] == "" ? "" : first ? " *" cell[i] "*" : " " words(cell[i]))
    }
}

function take(line) {
    if (line ~ /^    /) {
        if (!literal) print "```"
        literal = 1
        print substr(line, 5)
        return
    }
    end_literal()
    if (line ~ /^# /) return
    if (line ~ /^\|[-|: ]+\|$/) return
    if (line ~ /^\|/) {
        row(line, !table)
        table = 1
        return
    }
    table = 0
    if (line ~ /^## /) {
        print "# " toupper(substr(line, 4))
    } else if (line ~ /^- /) {
        print "- " words(substr(line, 3))
    } else if (line ~ /^  /) {
        print "  " words(substr(line, 3))
    } else {
        print words(line)
    }
}

$0 == "@TEXT@" {
    while ((got = (getline line < text)) > 0) take(line)
    end_literal()
    if (got < 0) {
        print "cannot read " text > "/dev/stderr"
        exit 1
    }
    next
}
{ print }
