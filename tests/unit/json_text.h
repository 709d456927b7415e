// JSON documents of tests, written as text.

#ifndef KELODRCORE_TESTS_UNIT_JSON_TEXT_H_
#define KELODRCORE_TESTS_UNIT_JSON_TEXT_H_

#include <json/json.h>

#include <string>

// Parsed by JsonCpp alone, not by the library under test; a broken text fails the test.
Json::Value Parse(const std::string& text);

#endif  // KELODRCORE_TESTS_UNIT_JSON_TEXT_H_
