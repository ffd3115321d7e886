# Every .cpp of these folders and below, picked up anew at each build.
function(sources_of variable)
  set(patterns ${ARGN})
  list(TRANSFORM patterns APPEND "/*.cpp")
  file(GLOB_RECURSE found CONFIGURE_DEPENDS ${patterns})
  set(${variable} ${found} PARENT_SCOPE)
endfunction()
