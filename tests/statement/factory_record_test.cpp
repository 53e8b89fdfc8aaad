// The factory's note of a device: what is written is read back, and nothing else is.
#include "client/lib/factory_record.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "client/lib/wire.h"

namespace {

using namespace keymaster::client;

const factory_record device{.device_id = {0x00, 0x1F, 0xFF},
                            .cpu_id = "0011/aabb",
                            .tee_n = "maker \"x\"",
                            .tee_v = "4.2",
                            .fp_n = "touchy \u20AC",
                            .fp_v = "",
                            .attk = "-----BEGIN PUBLIC KEY-----\nAAAA\n-----END PUBLIC KEY-----\n"};

factory_record read(const std::string& text) {
  return read_factory_record(as_bytes(text));
}

TEST(FactoryRecord, IsAJsonObjectThatIsReadBack) {
  const std::string text = write_factory_record(device);
  EXPECT_EQ(read(text), device);
  const auto object = nlohmann::ordered_json::parse(text);
  const nlohmann::ordered_json expected = {{"device_id", "001fff"}, {"cpu_id", device.cpu_id}, {"tee_n", device.tee_n},
                                           {"tee_v", device.tee_v}, {"fp_n", device.fp_n},     {"fp_v", device.fp_v},
                                           {"attk", device.attk}};
  EXPECT_EQ(object, expected);
  EXPECT_TRUE(text.ends_with("}\n"));
}

TEST(FactoryRecord, LacksNothingAndSaysNothingTwice) {
  const auto good = nlohmann::json::parse(write_factory_record(device));
  for (const auto& [name, value] : good.items()) {
    auto without = good;
    without.erase(name);
    EXPECT_THROW((void)read(without.dump()), format_error) << name;
    auto number = good;
    number[name] = 7;
    EXPECT_THROW((void)read(number.dump()), format_error) << name;
    const std::string twice = "{\"" + name + "\":" + value.dump() + "," + good.dump().substr(1);
    EXPECT_THROW((void)read(twice), format_error) << name;
  }
  auto more = good;
  more["colour"] = "red";
  EXPECT_THROW((void)read(more.dump()), format_error);
}

TEST(FactoryRecord, WhatIsNoRecordIsRefused) {
  for (const char* const text : {"", "{}", "[]", "7", "{", "null", "[{\"cpu_id\":\"x\"}]"}) {
    EXPECT_THROW((void)read(text), format_error) << text;
  }
  for (const char* const id : {"0", "0g", "0G", "AB", " 00", "0x00"}) {
    auto object = nlohmann::json::parse(write_factory_record(device));
    object["device_id"] = id;
    EXPECT_THROW((void)read(object.dump()), format_error) << id;
  }
}

TEST(FactoryRecord, TextsAreTexts) {
  for (const std::string& text : {std::string("\xFF"), std::string("a\0b", 3)}) {
    factory_record bad = device;
    bad.tee_n = text;
    EXPECT_THROW((void)write_factory_record(bad), format_error);
  }
  auto object = nlohmann::json::parse(write_factory_record(device));
  object["fp_n"] = std::string("a\0b", 3);
  EXPECT_THROW((void)read(object.dump()), format_error);
}

}  // namespace
