# Code pages: found by the language driver byte or a .cpg file, named in
# the ways people name them, memo text converted like the other text, a
# .cpg file beside the tables written, and characters the code page can't
# hold warned of (or refused under --strict).
source "$(dirname "$0")/lib.bash" "$1"
cd "$WORK" || exit 1

# hex FILE OFFSET COUNT: the bytes as plain hex
hex() { od -An -tx1 -j "$2" -N "$3" "$1" | tr -d ' \n'; }

# A dBASE III table, NAME C(10), "M\x81ller" (Müller in code page 850).
make_table dos.dbf && patch dos.dbf 98 'M\x81ller' && patch dos.dbf 29 '\x02'
expect_run 0 info dos.dbf && expect_out "code page:   850 (language driver byte 0x02)"
expect_run 0 cat dos.dbf && expect_out "Müller,42"
expect_run 0 cat dos.dbf --codepage 0 && expect_out "$(printf 'M\x81ller,42')"
expect_run 0 info dos.dbf --codepage 0 && expect_out "code page:   none, bytes as they are (--codepage)"
# The driver byte names 437 here: the byte 0x81 is ü there too; 1252 reads
# it as a character of its own. --codepage wins over the byte.
for name in 1252 cp1252 CP1252 windows-1252 "ANSI 1252"; do
  expect_run 0 cat dos.dbf --codepage "$name" && expect_out "$(printf 'M\xc2\x81ller,42')"
done
# No driver byte: a .cpg file beside the table, in any of its usual forms.
patch dos.dbf 29 '\x00'
expect_run 0 info dos.dbf && expect_out "code page:   none, bytes as they are (language driver byte 0x00, no .cpg file)"
for cpg in 850 CP850 "OEM 850"; do
  printf '%s\n' "$cpg" >dos.cpg
  expect_run 0 cat dos.dbf && expect_out "Müller,42"
done
expect_run 0 info dos.dbf && expect_out "code page:   850 (dos.cpg; language driver byte 0x00)"
printf 'KOI8-R' >dos.cpg
expect_run 0 cat dos.dbf && err_has "zqdb: warning: dos.cpg names no code page zqdb can convert (\"KOI8-R\")"
rm dos.cpg
expect_run 2 cat dos.dbf --codepage klingon && expect_err "zqdb: unknown code page: klingon (a number such as 437, 850"
expect_run 0 cat dos.dbf --codepage utf-8
expect_run 0 cat dos.dbf --codepage 65001

# Written tables: C and M text in the code page, a .cpg file naming it.
printf 'NAME,NOTE\nZoë,"Straße, Øre"\n€ 5,x\n' >in.csv
expect_run 0 convert in.csv w.dbf --schema "NAME C(8), NOTE M" --codepage 1252
same "C field in 1252" "$(hex w.dbf 99 4)" "5a6feb20"          # Z o ë blank
same ".cpg of 1252" "$(cat w.cpg)" "1252"
ok "memo not in code page 1252" grep -q "$(printf 'Stra\xdfe, \xd8re')" w.dbt
# The same into 850, which has no euro sign: one warning, the count and the
# first place; --strict refuses the run and leaves no table.
expect_run 0 convert in.csv d.dbf --schema "NAME C(8), NOTE M" --codepage cp850
expect_err "zqdb: warning: 1 characters that code page 850 can't hold were written as ? (the first in record 2, field NAME; --strict refuses them)"
same ".cpg of 850" "$(cat d.cpg)" "850"
same "C field in 850" "$(hex d.dbf 99 3)" "5a6f89"
expect_run 1 convert in.csv s.dbf --schema "NAME C(8), NOTE M" --codepage 850 --strict
expect_err 'zqdb: record 2, field NAME: "€ 5" has characters that code page 850 can'"'"'t hold'
absent s.dbf
# A DOS table to a Windows one in one run: --from-codepage, --to-codepage.
expect_run 0 convert d.dbf win.dbf --from-codepage 850 --to-codepage windows-1252
same "850 to 1252" "$(hex win.dbf 99 3)" "5a6feb"
same ".cpg of the target" "$(cat win.cpg)" "1252"
# Without --to-codepage a table copied keeps the source's code page, found
# by its .cpg file; appending to a table goes by the table's own.
expect_run 0 convert d.dbf copy.dbf && same "copy keeps 850" "$(hex copy.dbf 99 3)$(cat copy.cpg)" "5a6f89850"
expect_run 0 convert in.csv copy.dbf --mode append
same "append in 850" "$(hex copy.dbf 137 3)" "5a6f89"
# A table replaced by one without a code page loses the old .cpg, with a word.
printf 'NAME\nplain\n' >plain.csv
expect_run 0 convert plain.csv copy.dbf && err_has "zqdb: warning: removed copy.cpg, the code page file"
absent copy.cpg
# Index keys hold the table's bytes in its code page, as other programs build
# them; a width counts those bytes; keys and --seek speak UTF-8.
printf 'CITY\nBesançon12\nÉvreux\nAbbeville\n' >cities.csv
expect_run 0 convert cities.csv k.dbf --schema "CITY C(10)" --codepage 850 --index CITY=CITY
ok "a value that fits its 10 bytes in 850 warned: $(cat "$ERR")" not test -s "$ERR"
ok "k.mdx lacks the key in code page 850" grep -qa "$(printf 'Besan\x87on12')" k.mdx
expect_run 0 keys k.dbf --index CITY --seek "Év" && expect_out "Évreux,2"
expect_run 0 convert cities.csv k.dbf --mode update --key CITY && expect_run 0 check k.dbf
expect_run 0 info k.dbf && expect_out "records:     3 in the header"
finish
