# Makes a daemon's manual page of what its --help prints. Takes -v name=NAME, brief=ONE LINE, version=VERSION.
function plain(text) {
  gsub(/\\/, "\\e", text)
  gsub(/-/, "\\-", text)
  sub(/^[.']/, "\\\\\\&&", text)
  return text
}
BEGIN {
  printf ".TH %s 8 \"\" \"fileindex %s\" \"System Administration\"\n", toupper(name), version
  printf ".SH NAME\n%s \\- %s\n.SH SYNOPSIS\n.EX\n", name, plain(brief)
  part = "usage"
}
part == "usage" && NF == 0 {
  print ".EE\n.SH DESCRIPTION"
  part = "text"
  next
}
part == "usage" { print plain(substr($0, 8)); next }  # behind "Usage: "
/^  --/ {
  if (part != "options") print ".SH OPTIONS"
  part = "options"
  match($0, /^  .*[^ ]  +/)
  option = substr($0, 3)
  match(option, /  +/)
  printf ".TP\n\\fB%s\\fR\n%s\n", plain(substr(option, 1, RSTART - 1)), plain(substr(option, RSTART + RLENGTH))
  next
}
NF == 0 { if (part == "text") held = 1; next }
{
  if (part == "text" && held) print ".PP"
  held = 0
  sub(/^ +/, "")
  print plain($0)
}
END { print ".SH \"SEE ALSO\"\n.BR fileindexctl (1)" }
