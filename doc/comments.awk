# Doxygen reads the headers through this filter, which turns their plain comments into its own:
# - The comment at the head of a file describes the file, and the class or namespace in it.
# - A comment in front of declarations describes each of them, up to a blank line or the next comment.
# - A comment behind a declaration describes that declaration alone.
# - A comment with a blank line after it begins a group of members; its first line is the title.
# - In a comment, a line indented by two more blanks is an item of a list; lines indented further go on with it.
# Every line keeps its number, for Doxygen's warnings.

# A line of a comment: kept until the line after the comment shows what it describes.
/^ *\/\// {
    sub(/^ *\/\/ ?/, "")
    gsub(/README/, "@ref index \"README\"") # the main page
    sub(/^Returns? /, "<p>&") # a paragraph of its own
    if (!pending) {
        text = list = ""
    }
    if (/^$/) {
        $0 = "<p>"
    } else if (/^  [^ ]/) {
        sub(/^  /, list ? "<li>" : "<ul><li>")
        sub(/  +/, ": ") # between the columns of a table
        list = "</ul>"
    } else if (/^[^ ]/) {
        $0 = list $0
        list = ""
    }
    text = (pending ? text "\n" : "") $0
    pending = 1
    next
}

# The end of what the last comment describes.
/^$/ {
    if (pending && !code) {
        $0 = "/** " text list "\n@file */"
    } else if (pending) {
        $0 = endOfGroup "/** @name " text list "\n*/ /** @{ */"
        endOfGroup = "/** @} */ "
    }
    print
    text = ""
    pending = 0
    next
}

{
    code = 1
    if (pending) {
        print "/** " text list " */"
        pending = 0
    } else if (/^(class|namespace) .*\{$/) {
        file = FILENAME
        sub(/.*\//, "", file)
        $0 = "/** @copydoc " file " */ " $0
    } else if (/^};/) {
        $0 = endOfGroup $0
    } else if (text && previous ~ /;/ && !/; *\/\/ /) {
        gsub(/\n/, " ", text)
        $0 = "/** " text list " */ " $0
    }
    sub(/; *\/\/ /, "; ///< ")
    print
    previous = $0
}
