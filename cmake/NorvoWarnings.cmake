# Warning set shared by every target of the project.
add_library(norvo_warnings INTERFACE)
target_compile_options(norvo_warnings INTERFACE
  -Wall -Wextra -Wshadow -Wformat=2 -Wimplicit-fallthrough
  $<$<COMPILE_LANGUAGE:CXX>:-Wmissing-declarations>
  $<$<BOOL:${NORVO_WERROR}>:-Werror>)
