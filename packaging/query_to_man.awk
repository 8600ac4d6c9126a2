# Makes the manual's list of what a query may hold from what "fileindexctl search --help" prints of it.
function plain(text) {
  gsub(/\\/, "\\e", text)
  gsub(/-/, "\\-", text)
  sub(/^[.']/, "\\\\\\&&", text)
  return text
}
/^QUERY may hold:/ { inside = 1; next }
inside && match($0, /^  [^ ]+( [^ ]+)*  +/) {
  element = substr($0, 3, RLENGTH - 2)
  sub(/ +$/, "", element)
  printf ".TP\n\\fB%s\\fR\n%s\n", plain(element), plain(substr($0, RLENGTH + 1))
}
