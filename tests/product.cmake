# The product's sources on a scripted core.
add_executable(product-tests
    ChannelTest.cpp
    ErrorsTest.cpp
    ExportedCallsTest.cpp
    PathTest.cpp
    StreamsTest.cpp
    ValuesTest.cpp
    scripted/ScriptedCore.cpp
    $<TARGET_OBJECTS:brenixcoder-objects>)
target_include_directories(product-tests PRIVATE
    ${PROJECT_SOURCE_DIR}
    ${PROJECT_SOURCE_DIR}/include
    ${PROJECT_SOURCE_DIR}/core/include
    ${CMAKE_CURRENT_LIST_DIR})
target_link_libraries(product-tests PRIVATE GTest::gtest_main Threads::Threads)
brenix_warnings(product-tests)
gtest_discover_tests(product-tests)
