// Failure values of the module's status convention.
#pragma once

#include "../host/karvelkStatus.h"

constexpr tStatus kStatusRangeInverted = -50000;
constexpr tStatus kStatusMissingOrMalformed = -50150;
constexpr tStatus kStatusFlashNotRecognised = -50151;
constexpr tStatus kStatusForeignOrUnverified = -50152;
constexpr tStatus kStatusImageReadFailed = -50207;
constexpr tStatus kStatusInstalledTooOld = -50252;
constexpr tStatus kStatusInstalledTooNew = -50253;
constexpr tStatus kStatusNotObtained = -50352;
constexpr tStatus kStatusRegistryKeyNotFound = -100000;
