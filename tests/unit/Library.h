/// The fixture of the library's tests, and the words that they are written in.
#pragma once

#include "tests/fake/Fake.h"
#include "tests/fake/Process.h"

#include <gtest/gtest.h>
#include <json/value.h>

#include <string>
#include <vector>

namespace unit {

using Lines = std::vector<std::string>;

/// What a failing platform call returns.
constexpr int INJECTED = 18990999;

/// Secrets of the targets that addTarget makes. No log line of any test may hold one.
const char *const SECRET = "opensesame-in";
const char *const MUTUAL_SECRET = "opensesame-out";

constexpr unsigned long long GIB = 1ULL << 30;

class LibraryTest : public testing::Test {
protected:
    LibraryTest();
    ~LibraryTest() override;
};

/// Log lines since the last call, once detached workers have ended: "method: text" for "file:line:method text", ":
/// text" for a head without method, "[E] method: text" for the tagged form, "[info] method: text" for a line that is no
/// failure.
Lines logged();

/// Platform calls since the last call, once detached workers have ended, as "Name(arguments)"; those whose names begin
/// with one of `prefixes`.
Lines called(const Lines &prefixes = {""});

std::string uuidOf(int lid);

/// A LUN in the fake's model: 1 GiB in /volume1, with extents of 64 KiB.
fake::LUN &addLUN(int lid, const std::string &name, int type = NORV_LUN_TYPE_ADV);
_tag_iscsi_lun_ recordOf(int lid);

std::string snapshotUUIDOf(int lid, int number);

/// A snapshot in the fake's model: 1 GiB, taken `number` seconds after EPOCH.
fake::Snapshot &addSnapshot(int lid, int number, const std::string &name);
constexpr int EPOCH = 1234571490; ///< Sat Feb 14 00:31:30 UTC 2009

/// Writes a file, which goes when the test ends.
void writeFile(const std::string &path, const std::string &text);

/// A LUN ID that no other test program uses now, for paths made of it. The platform's own end at 1024.
int privateLUNID();

/// An enabled target in the fake's model, with CHAP in both directions.
fake::Target &addTarget(int tid, const std::string &name);
void addMapping(int tid, int lid, int mapping_index = 1);

/// This appliance and a paired one in the fake's database, the latter with a ROD key and a session.
const char *const LOCAL_NODE = "11111111-0000-4000-8000-000000000001";
const char *const PEER_NODE = "11111111-0000-4000-8000-000000000002";
const char *const KEPT_ROD_KEY = "kept-rod-key";
const char *const PEER_SESSION = "peer-session";
void addNodes();

Json::Value parsed(const std::string &json);

} // namespace unit
