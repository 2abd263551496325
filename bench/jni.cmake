# The JVM benchmark of a whole classification through JNI (bench/jni/): a jar
# over the Java package and the JVM tests' native helpers, run by
# scripts/bench-java.sh. It needs only Java, so every build that makes the
# jars has it, the shipped ones included.
find_package(Java 17 COMPONENTS Development REQUIRED)
include(UseJava)
set(CMAKE_JAVA_COMPILE_FLAGS --release 17 -Xlint:all -Werror -encoding UTF-8)
set(_bench_java ${CMAKE_BINARY_DIR}/bench-java)
add_custom_command(
  OUTPUT ${_bench_java}/ExampleCollection.java
  COMMAND ${RELIQA_DEBIAN_PYTHON} ${CMAKE_CURRENT_LIST_DIR}/jni/example_collection.py
          ${PROJECT_SOURCE_DIR}/examples/collection.json ${_bench_java}/ExampleCollection.java
  DEPENDS ${CMAKE_CURRENT_LIST_DIR}/jni/example_collection.py ${PROJECT_SOURCE_DIR}/examples/collection.json
  COMMENT "Writing the example collection as Java records"
  VERBATIM)
add_jar(reliqa_bench_jar
  SOURCES ${CMAKE_CURRENT_LIST_DIR}/jni/ClassifyReliqaBench.java ${_bench_java}/ExampleCollection.java
  INCLUDE_JARS reliqa_jar reliqa_tests_jar
  OUTPUT_NAME reliqa-bench
  OUTPUT_DIR ${CMAKE_BINARY_DIR}/java)
