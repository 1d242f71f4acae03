#pragma once

#include "report.h"

namespace typhon::bench {

// Each measures one part of the system beside its bare peers and adds its rows.

void measureLoading(Report& report);
void measureCheckIn(Report& report);
void measureUpdating(Report& report);
void measureOpening(Report& report);
void measureIdleConnections(Report& report);
void measureStart(Report& report);
void measureLedger(Report& report);
void measureBroadcast(Report& report);
void measureInstalling(Report& report);
void measureRequest(Report& report);
void measureNames(Report& report);
void measureShares(Report& report);
void measureDeletion(Report& report);
void measureAssets(Report& report);
void measureWatch(Report& report);
void measureHostile(Report& report);

}  // namespace typhon::bench
