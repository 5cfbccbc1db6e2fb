# The headers that users of an installed vemo can include: the umbrella headers, a few that stand beside them for those who
# write an engine or examine a space, and all that these include.
function(vemo_list_public_headers result)
  set(pending vemo/maps.h vemo/store.h store/collect.h store/dump.h store/engine.h store/raw_check.h store/reading_engine.h store/salvage.h
              store/statistics.h store/verify.h)
  if(TARGET vemo_history)
    list(APPEND pending vemo/history.h history/blame.h history/verify_history.h)
  endif()
  set(found)
  while(pending)
    list(POP_FRONT pending header)
    if(header IN_LIST found)
      continue()
    endif()
    list(APPEND found ${header})
    file(STRINGS ${PROJECT_SOURCE_DIR}/${header} includes REGEX "^#include \"")
    foreach(line IN LISTS includes)
      string(REGEX REPLACE "^#include \"([^\"]+)\".*" "\\1" included "${line}")
      list(APPEND pending ${included})
    endforeach()
  endwhile()
  list(SORT found)
  set(${result} ${found} PARENT_SCOPE)

  # A header that starts to include another one makes that one public.
  list(TRANSFORM found PREPEND ${PROJECT_SOURCE_DIR}/)
  set_property(DIRECTORY ${PROJECT_SOURCE_DIR} APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${found})
endfunction()
