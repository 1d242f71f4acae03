#pragma once

#include "platform/property_list.h"

#include <string>

namespace typhon {

/// The ledger of issued fonts as the preferences store it ("issues"), with whole paths in the place of the
/// stored ones: identifier to array of paths. What is malformed is left out.
PropertyList expandedLedger(const PropertyList& issues);

/// An expanded ledger for people.
std::string ledgerText(const PropertyList& ledger);

}  // namespace typhon
