# The library's layering, checked when the build is configured. Subsystems
# are declared bottom up, each naming the subsystems it uses; a subsystem may
# use only those declared before it, so the graph can hold no loop. Every
# include of another subsystem's header must be covered by a declared
# dependency (directly or through one), and only the foundation and the
# platform layer may include the portable platform: src/platform/ is the one
# door through which everything above reaches it.

set(ORVEX_LAYER_SUBSYSTEMS "" CACHE INTERNAL "")

# The portable headers every layer may include: plain types, no platform call.
set(ORVEX_PORTABLE_FOR_ALL "orvex/portable/file_descriptor.h")
# The layers that may include the portable platform's headers.
set(ORVEX_PORTABLE_DOORS foundation platform)

# Records sub's dependencies (names of subsystems, without orvex_) and
# refuses any that is not declared yet.
function(orvex_layer_declare sub)
  foreach(dep ${ARGN})
    if(NOT dep IN_LIST ORVEX_LAYER_SUBSYSTEMS)
      message(FATAL_ERROR
        "subsystem '${sub}' depends on '${dep}', which is not declared before it. "
        "Declare subsystems bottom up; a dependency loop means some code belongs "
        "in the caller above both.")
    endif()
  endforeach()
  set(ORVEX_LAYER_SUBSYSTEMS "${ORVEX_LAYER_SUBSYSTEMS};${sub}" CACHE INTERNAL "")
  set(ORVEX_LAYER_DEPS_${sub} "${ARGN}" CACHE INTERNAL "")
endfunction()

function(_orvex_layer_closure sub out)
  set(seen "")
  set(todo ${ORVEX_LAYER_DEPS_${sub}})
  while(todo)
    list(POP_FRONT todo dep)
    if(NOT dep IN_LIST seen)
      list(APPEND seen ${dep})
      list(APPEND todo ${ORVEX_LAYER_DEPS_${dep}})
    endif()
  endwhile()
  set(${out} ${seen} PARENT_SCOPE)
endfunction()

# The subsystem an include names, or "" for one outside the library:
# "orvex/queue/op.h", "orvex/queue.h" and the internal "queue/line_reader.h"
# all name queue; "orvex/portable/..." and "kalo/..." give "portable".
function(_orvex_layer_of include out)
  set(layer "")
  if(include MATCHES "^kalo/" OR include MATCHES "^orvex/portable/")
    set(layer portable)
  elseif(include MATCHES "^orvex/([a-z_]+)(/|\\.h$)")
    set(layer ${CMAKE_MATCH_1})
  elseif(include MATCHES "^([a-z_]+)/")
    set(layer ${CMAKE_MATCH_1})
  endif()
  if(NOT layer STREQUAL "portable" AND NOT layer IN_LIST ORVEX_LAYER_SUBSYSTEMS)
    set(layer "")
  endif()
  set(${out} ${layer} PARENT_SCOPE)
endfunction()

function(orvex_check_layers)
  set(problems "")
  foreach(sub ${ORVEX_LAYER_SUBSYSTEMS})
    if(NOT sub)
      continue()
    endif()
    _orvex_layer_closure(${sub} allowed)
    file(GLOB files ${PROJECT_SOURCE_DIR}/src/${sub}/*.h ${PROJECT_SOURCE_DIR}/src/${sub}/*.cc
                    ${PROJECT_SOURCE_DIR}/include/orvex/${sub}/*.h)
    if(EXISTS ${PROJECT_SOURCE_DIR}/include/orvex/${sub}.h)
      list(APPEND files ${PROJECT_SOURCE_DIR}/include/orvex/${sub}.h)
    endif()
    foreach(file ${files})
      file(STRINGS ${file} lines REGEX "^#include \"")
      foreach(line ${lines})
        string(REGEX REPLACE "^#include \"([^\"]+)\".*" "\\1" include "${line}")
        _orvex_layer_of("${include}" layer)
        file(RELATIVE_PATH rel ${PROJECT_SOURCE_DIR} ${file})
        if(layer STREQUAL "portable")
          if(NOT sub IN_LIST ORVEX_PORTABLE_DOORS AND NOT include IN_LIST ORVEX_PORTABLE_FOR_ALL)
            list(APPEND problems "${rel} includes ${include}: reach the platform through src/platform/")
          endif()
        elseif(layer AND NOT layer STREQUAL sub AND NOT layer IN_LIST allowed)
          list(APPEND problems "${rel} includes ${include}, but ${sub} does not depend on ${layer}")
        endif()
      endforeach()
    endforeach()
  endforeach()
  if(problems)
    list(JOIN problems "\n  " text)
    message(FATAL_ERROR "layering broken:\n  ${text}")
  endif()
endfunction()
