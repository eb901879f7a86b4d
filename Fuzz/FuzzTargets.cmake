# The sources of the fuzz targets, and the name that belongs to each.
file(GLOB kernel_fuzz_sources CONFIGURE_DEPENDS "${CMAKE_CURRENT_LIST_DIR}/*.cpp")

function(kernel_fuzz_name source result)
    get_filename_component(name "${source}" NAME_WE)
    string(REGEX REPLACE "([a-z0-9])([A-Z])" "\\1_\\2" name "${name}")
    string(TOLOWER "${name}" name)
    set(${result} "${name}" PARENT_SCOPE)
endfunction()
