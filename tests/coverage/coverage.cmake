# For the preset `coverage`: every program counts its lines and branches.

enable_language(C)
add_library(coverage_dump STATIC ${CMAKE_CURRENT_LIST_DIR}/dump.c)
add_compile_options(--coverage -O0 -fprofile-update=atomic)
add_link_options(--coverage)
foreach(call abort _exit raise execv execvp)
  add_link_options(-Wl,--wrap=${call})
endforeach()
link_libraries(coverage_dump)
