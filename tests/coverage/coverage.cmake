# For the preset `coverage`: every program counts its lines and branches.

enable_language(C)
add_library(coverage_dump STATIC ${CMAKE_CURRENT_LIST_DIR}/dump.c)
# What guards a static variable against other threads would be branches that no test can take.
add_compile_options(--coverage -O0 -fprofile-update=atomic -fno-threadsafe-statics)
add_link_options(--coverage)
foreach(call abort _exit raise execv execvp)
  add_link_options(-Wl,--wrap=${call})
endforeach()
# Also where nothing calls it but what counts.
add_link_options(-Wl,--undefined=__wrap_abort)
link_libraries(coverage_dump)
