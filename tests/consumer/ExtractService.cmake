# Writes the minimal service of docs/GUIDE.md, the code block between its guide-service markers,
# to OUT, so the consumer tests build exactly what the guide prints. With DROP=<member>, the
# statement that assigns that member is left out (a newcomer's mistake, for the "newcomer" test).
#   cmake -DGUIDE=<GUIDE.md> -DOUT=<file> [-DDROP=<member>] -P ExtractService.cmake
file(READ "${GUIDE}" lGuide)
if(NOT lGuide MATCHES "<!-- guide-service:begin -->\n```cpp\n(.*)\n```\n<!-- guide-service:end -->")
  message(FATAL_ERROR "${GUIDE}: no cpp code block between the guide-service markers")
endif()
set(lCode "${CMAKE_MATCH_1}\n")
if(DROP)
  string(REGEX REPLACE "\n[^\n]*${DROP} =[^;]*;" "" lDropped "${lCode}")
  if(lDropped STREQUAL lCode)
    message(FATAL_ERROR "${GUIDE}: the service assigns no ${DROP}")
  endif()
  set(lCode "${lDropped}")
endif()
file(WRITE "${OUT}" "${lCode}")
