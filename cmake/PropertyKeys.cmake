# Writes OUT, the keys of the property table IN (config/PropertyTable.cpp) as C++ string
# literals, one per line, for the host's misspelt-key warning: the host platform sits below the
# table's layer and cannot link it. An entry begins "{P::kName, "key"". Run with cmake -P.
file(READ "${IN}" content)
string(REGEX MATCHALL "{P::k[A-Za-z0-9]+, *\"[^\"]+\"" entries "${content}")
set(keys "")
foreach(entry IN LISTS entries)
  string(REGEX REPLACE "^.*\"([^\"]+)\"$" "\\1" key "${entry}")
  string(APPEND keys "\"${key}\",\n")
endforeach()
if(keys STREQUAL "")
  message(FATAL_ERROR "no property entries in ${IN}")
endif()
file(WRITE "${OUT}.tmp" "// Generated from ${IN_NAME}; edit that file instead.\n${keys}")
file(RENAME "${OUT}.tmp" "${OUT}")
