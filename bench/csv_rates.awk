# Reads a benchmark program's --benchmark_format=csv report and prints "NAME RATE" for every run that has the
# "Mpx/s" counter: the name without quotes or its /real_time ending, repetitions' aggregates left out.
BEGIN { FS = "," }
NR == 1 { for (i = 1; i <= NF; i++) if ($i == "\"Mpx/s\"") column = i; next }
column && $column != "" && $1 !~ /_(mean|median|stddev|cv)"?$/ {
  name = $1
  gsub(/"/, "", name)
  sub(/\/real_time$/, "", name)
  print name, $column
}
