# Installs the build in BUILD into a fresh prefix and builds the consumer in SOURCE against it, by the CMake package and
# by pkg-config. Run by ctest:  cmake -D BUILD=... -D SOURCE=... -D WORK=... -D COMPILER=... -P check.cmake
cmake_minimum_required(VERSION 3.25)

function(run what)
    execute_process(COMMAND ${ARGN} RESULT_VARIABLE status OUTPUT_VARIABLE output ERROR_VARIABLE errors)
    if(NOT status EQUAL 0)
        message(FATAL_ERROR "${what} failed (${status}):\n${output}${errors}")
    endif()
    set(output "${output}" PARENT_SCOPE)
endfunction()

function(check_answer what)
    run("${what}" ${ARGN})
    if(NOT output STREQUAL "Spring tide at noon.\n")
        message(FATAL_ERROR "${what} printed '${output}'")
    endif()
endfunction()

file(REMOVE_RECURSE "${WORK}")
run("installing" ${CMAKE_COMMAND} --install ${BUILD} --prefix ${WORK}/prefix)
file(GLOB_RECURSE internal "${WORK}/prefix/include/*/internal/*")
if(internal)
    message(FATAL_ERROR "internal headers were installed: ${internal}")
endif()

# The package has to be found where it was moved to: nothing in it may name the place it was built for.
file(RENAME "${WORK}/prefix" "${WORK}/moved")
run("configuring the consumer" ${CMAKE_COMMAND} -G Ninja -S ${SOURCE} -B ${WORK}/build
    -D CMAKE_PREFIX_PATH=${WORK}/moved -D CMAKE_CXX_COMPILER=${COMPILER} -D "CMAKE_CXX_FLAGS=${FLAGS}")
run("building the consumer" ${CMAKE_COMMAND} --build ${WORK}/build)
check_answer("the consumer" ${WORK}/build/consumer ${WORK}/first.doc)

find_program(pkg_config pkg-config)
file(GLOB_RECURSE pc "${WORK}/moved/*/libkernel.pc")
if(pkg_config)
    cmake_path(GET pc PARENT_PATH pc_dir)
    set(ENV{PKG_CONFIG_PATH} "${pc_dir}")
    run("pkg-config" ${pkg_config} --cflags --libs libkernel)
    string(STRIP "${output}" flags)
    separate_arguments(flags UNIX_COMMAND "${flags} ${FLAGS}")
    cmake_path(GET pc_dir PARENT_PATH lib_dir)
    run("building with pkg-config" ${COMPILER} -std=c++20 ${SOURCE}/consumer.cpp -o ${WORK}/by-pkg-config ${flags}
        -Wl,-rpath,${lib_dir})
    check_answer("the program built with pkg-config" ${WORK}/by-pkg-config ${WORK}/second.doc)
endif()

file(GLOB tool "${WORK}/moved/bin/kerneltool")
if(tool)
    run("the installed tool" ${tool} --version)
    # The mapping files came along and are found where they were moved to: in Symbol an A is an Alpha.
    file(WRITE "${WORK}/mac.txt" "A")
    run("reading by a mapping file" ${tool} text convert --from mac:8 "${WORK}/mac.txt")
    if(NOT output STREQUAL "Α")
        message(FATAL_ERROR "the installed mapping files gave '${output}'")
    endif()
endif()
