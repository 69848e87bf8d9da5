// The life cycle of typed data at the handle level: layout queries, default data, disposal,
// verification and the two-step dispatch of copy with conversion.
#pragma once

#include <cstdint>
#include <optional>

#include "source/model/TD.h"

// What a null handle's VerifyData answers: no type, so nothing can be said about the data.
constexpr int32_t kVerifyDataNoType = 0x100000;
// What the rave procedure is told about the damage VerifyData found.
constexpr int32_t kRaveVerifyData = 1024;

// Copies `src` (data of `srcType`) into `dstData` (data of `dstType`), converting: the
// destination's CopyDataConvertDestOverride first, else the source's CopyDataConvertCore.
// 1 when either data pointer is null, 42 when either type is null.
int32_t CopyDataConvertImp(const TDImp* srcType, const TDImp* dstType, const void* src, void* dstData,
                           int32_t flags);

// The status to report for damaged data: what the rave procedure (SetTDRaveProc) leaves when
// called with `code` (kRaveVerifyData unless a family says otherwise); without a procedure the
// damage is reported as status 1, never as sound data.
int32_t RaveStatusForDamage(int32_t code = kRaveVerifyData);
// The one diagnostic line of damaged data: the status, the type code and the data address, and
// for an element of a container its offset.
void WriteVerifyDataMessage(int32_t status, const TDImp& type, const void* data,
                            std::optional<int64_t> eltOffset = std::nullopt);
// Both: a datum of `type` at `data` failed its check. Returns the status, after the diagnostic
// when it is nonzero.
int32_t ReportDamagedData(const TDImp& type, const void* data);
