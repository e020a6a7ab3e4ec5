# The product's sources on a scripted core.
add_executable(product-tests
    Allocations.cpp
    ChannelTest.cpp
    ErrorsTest.cpp
    ExportedCallsTest.cpp
    PathTest.cpp
    StreamsTest.cpp
    ValuesTest.cpp
    scripted/ScriptedCore.cpp
    $<TARGET_OBJECTS:brenixcoder-objects>)
add_executable(random-tests
    RandomTest.cpp
    scripted/ScriptedCore.cpp
    $<TARGET_OBJECTS:brenixcoder-objects>)
foreach(program product-tests random-tests)
    target_include_directories(${program} PRIVATE
        ${PROJECT_SOURCE_DIR}
        ${PROJECT_SOURCE_DIR}/include
        ${PROJECT_SOURCE_DIR}/core/include
        ${CMAKE_CURRENT_LIST_DIR})
    target_link_libraries(${program} PRIVATE GTest::gtest_main Threads::Threads)
    brenix_warnings(${program})
    gtest_discover_tests(${program})
endforeach()
