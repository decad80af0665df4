# Translates docs/messages.toml into a table for the command, so that it can explain log lines where
# neither the documents nor an interpreter for them are installed.
#     cmake -D INPUT=docs/messages.toml -D OUTPUT=catalogue.inc -P catalogue.cmake
#
# Each line "key = "text"" becomes {"key", "text"}: texts of both languages have the same escapes.
# A header becomes the "id" with which an entry begins.
file(READ ${INPUT} text)
string(PREPEND text "\n")
string(REGEX REPLACE "\n#[^\n]*" "" text "${text}")
string(REGEX REPLACE "\nannounced = [^\n]*" "" text "${text}")
string(REPLACE "\n[modules]" "" text "${text}")
string(REGEX REPLACE "\n(\"[^\"\n]*\") = \"[^\n]*\"" "\n{\"module\", \\1}," text "${text}")
string(REGEX REPLACE "\n\\[\"([^\"\n]*)\"\\.([0-9a-z-]+)\\]" "\n{\"id\", \"\\1:\\2\"}," text "${text}")
string(REGEX REPLACE "\n(text|from|meaning|action|priority) = (\"[^\n]*\")" "\n{\"\\1\", \\2},"
       text "${text}")
string(REPLACE "\nplain = true" "\n{\"plain\", \"true\"}," text "${text}")
string(REGEX REPLACE "\n\n+" "\n" text "${text}")
string(REGEX MATCH "\n[^{\n][^\n]*" rest "${text}")
if(rest)
  message(FATAL_ERROR "${INPUT}: a line that this script does not know:${rest}")
endif()
file(WRITE ${OUTPUT} "${text}")
