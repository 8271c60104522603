# Checks that the shared library exports exactly the listed functions, that
# its SONAME is libpxalarms.so.6, and that the host's runtime functions stay
# undefined imports.
execute_process(COMMAND ${NM} -D --defined-only ${LIBRARY}
  OUTPUT_VARIABLE defined RESULT_VARIABLE rc)
if(NOT rc EQUAL 0)
  message(FATAL_ERROR "nm failed on ${LIBRARY}")
endif()
string(REGEX MATCHALL "[0-9a-fA-F]+ [TtWwDdBbRrVviu] [^\n]+" lines "${defined}")
set(exported "")
foreach(line IN LISTS lines)
  string(REGEX REPLACE "^[0-9a-fA-F]+ ([A-Za-z]) (.+)$" "\\1;\\2" parts "${line}")
  list(GET parts 0 kind)
  list(GET parts 1 name)
  # Ignore the sanitizer runtime's and the C++ runtime's own symbols.
  if(name MATCHES "^(__asan|__ubsan|__tsan|__sanitizer|__lsan|_init$|_fini$|__bss_start|_edata|_end)")
    continue()
  endif()
  list(APPEND exported "${name}")
endforeach()
list(SORT exported)

file(STRINGS ${EXPORTS} expected)
list(SORT expected)
if(NOT exported STREQUAL expected)
  string(REPLACE ";" "\n  " got "${exported}")
  string(REPLACE ";" "\n  " want "${expected}")
  message(FATAL_ERROR "exported set differs\nexported:\n  ${got}\nexpected:\n  ${want}")
endif()

execute_process(COMMAND ${NM} -D --undefined-only ${LIBRARY} OUTPUT_VARIABLE undefined)
foreach(host IN LISTS HOST_IMPORTS)
  if(NOT undefined MATCHES "U ${host}\n")
    message(FATAL_ERROR "${host} is not an undefined import of ${LIBRARY}")
  endif()
endforeach()

execute_process(COMMAND ${OBJDUMP} -p ${LIBRARY} OUTPUT_VARIABLE headers)
if(NOT headers MATCHES "SONAME +libpxalarms\\.so\\.6\n")
  message(FATAL_ERROR "SONAME of ${LIBRARY} is not libpxalarms.so.6")
endif()
