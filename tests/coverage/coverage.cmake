# For the preset `coverage`: every program counts its lines and branches.

enable_language(C)
add_compile_options(--coverage -O0 -fprofile-update=atomic)
add_link_options(--coverage -Wl,--wrap=abort,--wrap=_exit,--wrap=raise)
add_library(coverage_dump STATIC ${CMAKE_CURRENT_LIST_DIR}/dump.c)
link_libraries(coverage_dump)
