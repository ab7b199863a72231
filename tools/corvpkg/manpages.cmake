# Writes the manual pages of corvpkg from its own help texts: corvpkg.1 for the program and
# corvpkg-<command>.1 for each command, so the pages never drift from --help.
# Run as: cmake -DCORVPKG=<program> -DHELP2MAN=<help2man> -DOUT=<dir> -P manpages.cmake
file(MAKE_DIRECTORY ${OUT})
execute_process(COMMAND ${CORVPKG} --help OUTPUT_VARIABLE help RESULT_VARIABLE status)
if(NOT status EQUAL 0)
  message(FATAL_ERROR "${CORVPKG} --help failed")
endif()

function(page name option summary)
  execute_process(COMMAND ${HELP2MAN} -N --no-discard-stderr "--help-option=${option}"
                          "--name=${summary}" ${CORVPKG}
                  OUTPUT_VARIABLE text RESULT_VARIABLE status)
  if(NOT status EQUAL 0)
    message(FATAL_ERROR "help2man failed for ${name}")
  endif()
  # help2man names every page after the program; a command's page is corvpkg-<command>.
  string(TOUPPER "${name}" upper)
  string(REPLACE ".TH CORVPKG " ".TH ${upper} " text "${text}")
  string(REPLACE "\n.SH NAME\ncorvpkg \\- " "\n.SH NAME\n${name} \\- " text "${text}")
  file(WRITE ${OUT}/${name}.1 "${text}")
endfunction()

page(corvpkg --help "the package engine of the NOS appliance")
# The command table is the part of the help after "commands:", one "  name  summary" a line.
string(FIND "${help}" "commands:\n" start)
string(SUBSTRING "${help}" ${start} -1 table)
string(REPLACE "\n" ";" rows "${table}")
foreach(row IN LISTS rows)
  if(row MATCHES "^  ([a-z][a-z0-9-]*)  +(.*)$")
    page(corvpkg-${CMAKE_MATCH_1} "${CMAKE_MATCH_1} --help" "${CMAKE_MATCH_2}")
  endif()
endforeach()
