# Installs the development files of BUILD_DIR below WORK_DIR, builds the consumer there against nothing else, and runs it.
# Given: BUILD_DIR, WORK_DIR, GENERATOR, COMPILER, FLAGS, LIBDIR.
file(REMOVE_RECURSE ${WORK_DIR})
set(root ${WORK_DIR}/root)
set(ENV{PKG_CONFIG_PATH} ${root}/${LIBDIR}/pkgconfig)
set(ENV{EXTORA_RUNTIME_DIR} ${WORK_DIR}/runtime)

function(run)
  execute_process(COMMAND ${ARGV} RESULT_VARIABLE status OUTPUT_VARIABLE output ERROR_VARIABLE output)
  if(NOT status EQUAL 0)
    message(FATAL_ERROR "${ARGV}: ${status}\n${output}")
  endif()
  set(output "${output}" PARENT_SCOPE)
endfunction()

run(${CMAKE_COMMAND} --install ${BUILD_DIR} --prefix ${root} --component dev)

# Nothing installed may name the tree that it was built in, nor bring the project's warnings along.
file(GLOB_RECURSE texts ${root}/*.cmake ${root}/*.pc)
foreach(text ${texts})
  file(READ ${text} content)
  if(content MATCHES "Werror|Wthread" OR content MATCHES "${BUILD_DIR}/(platform|Extora)")
    message(FATAL_ERROR "${text} carries what belongs to the build")
  endif()
endforeach()

file(COPY ${CMAKE_CURRENT_LIST_DIR}/../../../examples/ DESTINATION ${WORK_DIR}/tree/examples FILES_MATCHING PATTERN "*.h" PATTERN "*.cpp")
run(${CMAKE_COMMAND} -S ${CMAKE_CURRENT_LIST_DIR} -B ${WORK_DIR}/build -G ${GENERATOR}
    -DEXAMPLES=${WORK_DIR}/tree -DCMAKE_PREFIX_PATH=${root} -DCMAKE_CXX_COMPILER=${COMPILER} -DCMAKE_CXX_FLAGS=${FLAGS})
run(${CMAKE_COMMAND} --build ${WORK_DIR}/build)
foreach(program consumer consumer_pc)
  run(${WORK_DIR}/build/${program})
  if(NOT output MATCHES "Extora 4: .*com\\.example\\.nobody")
    message(FATAL_ERROR "${program} printed: ${output}")
  endif()
endforeach()
