// What properties are tried with: names, keys and records, drawn so that the units and lengths that
// decide something come often.
#pragma once

#include <gtest/gtest.h>
#include <rapidcheck.h>
#include <rapidcheck/gtest.h>

#include <vector>

#include "hfs/names_text.h"
#include "platform/types.h"

namespace VELK {

// Units of a name. Numbers, so that a failure prints them.
using Units = std::vector<u16>;
using Bytes = std::vector<u8>;

// Any unit: letters in both cases, marks, ignorable units, surrogates, what texts must escape.
rc::Gen<u16> AnyUnit();
// Up to `most` of them.
rc::Gen<Units> AnyName(u32 most);
// Names of so few different units that equal ones and common beginnings come often.
rc::Gen<Units> AlikeName();

// One of the three trees.
rc::Gen<u32> AnyTree();
// A key of tree `fileId` as stored, its length field right.
rc::Gen<Bytes> AnyKey(u32 fileId);
// A record of tree `fileId` as stored: of a known kind and size, its fields anything.
rc::Gen<Bytes> AnyRecord(u32 fileId);

NameUnits InHostOrder(const Units& units);
// As stored: big-endian.
Bytes Stored(const Units& units);

}  // namespace VELK
