add_compile_options(-Wall -Wextra -Wconversion -Wshadow -Wold-style-cast -Wsuggest-override
                    -Wnon-virtual-dtor $<$<CXX_COMPILER_ID:Clang>:-Wthread-safety> -Werror)
# Lets ccache keep objects that use a precompiled header; clang needs nothing for that.
add_compile_options($<$<CXX_COMPILER_ID:GNU>:-fpch-preprocess>)

if(APPSYNC_SANITIZE)
  add_compile_options(-fsanitize=${APPSYNC_SANITIZE} -fno-omit-frame-pointer
                      -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${APPSYNC_SANITIZE})
  # The check of an object's type opens a pipe, and takes a process without a free descriptor, which
  # tests make, for a fault.
  if(APPSYNC_SANITIZE MATCHES undefined)
    add_compile_options(-fno-sanitize=vptr)
  endif()
  # In instrumented code g++ 12 sees faults where there are none, such as uninitialised members of
  # empty optionals: warnings are errors in the build without sanitizers only.
  add_compile_options(-Wno-error)
endif()

# So it does in fully optimised code: copies of strings that overlap or are of impossible length.
add_compile_options("$<$<AND:$<CXX_COMPILER_ID:GNU>,$<CONFIG:Release>>:\
-Wno-restrict;-Wno-stringop-overflow;-Wno-array-bounds;-Wno-error>")
