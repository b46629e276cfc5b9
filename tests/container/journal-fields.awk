# Reads journal entries in the export format and prints those that are not as the daemon writes them:
# native ones with severity 6 and the place in the code, whose line the text names as well, those of the
# platform, which name none, and lines of a failing library call, which come by standard output.

BEGIN {
    RS = ""
    FS = "\n"
}

function is_native(field, text, function_part) {
    if (field["_TRANSPORT"] != "journal" || field["PRIORITY"] != "6" || field["SYSLOG_IDENTIFIER"] != "kstd")
        return 0
    text = field["MESSAGE"]
    if (text ~ /AssertMacros/)
        return ends_with(text, ":" field["CODE_LINE"]) && field["CODE_FILE"] ~ /^(kstd|common|KSTLib)\/.*\.(cpp|h)$/
    if (text ~ /^kstd: [A-Z][A-Za-z]*: /)
        return !("CODE_FUNC" in field)
    function_part = ": " field["CODE_FUNC"] ": "
    return field["CODE_FUNC"] != "" && index(text, function_part) == index(text, ": ")
}

function ends_with(text, end) {
    return substr(text, length(text) - length(end) + 1) == end
}

{
    split("", field)
    for (i = 1; i <= NF; ++i) {
        sign = index($i, "=")
        field[substr($i, 1, sign - 1)] = substr($i, sign + 1)
    }
    if (!is_native(field) && !(field["_TRANSPORT"] == "stdout" && field["MESSAGE"] ~ /^KST: LibCall_/))
        print $0 "\n"
}

END {
    if (NR == 0)
        print "no entries"
}
