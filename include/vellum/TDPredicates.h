// The kind predicates of a descriptor, in their slot order. One list drives the virtual slots of
// the descriptor object and the null-safe wrappers on the handles, so the two never drift apart.
#pragma once

// Slots 42 to 164.
#define VELLUM_TD_PREDICATES_FIRST(X)                                                          \
  X(IsVoid) X(IsNumeric) X(IsBasicNumeric) X(IsInteger) X(IsFloat) X(IsComplex)                \
  X(IsFixedPoint) X(IsClust) X(IsNumericClust) X(IsArrayBase) X(IsArrayInterface)              \
  X(IsInterfaceToData) X(IsArray) X(IsArrayOnly) X(IsSubArrayOnly) X(IsArrayDataPtr)           \
  X(IsStringBase) X(IsString) X(IsStringOnly) X(IsSubStringOnly) X(IsCollection)               \
  X(IsSetCollection) X(IsMapCollection) X(IsPict) X(IsPath) X(IsTag) X(IsUserDefinedTag)        \
  X(IsBool) X(IsBoolU16) X(IsRefnum) X(IsRCRefnum) X(IsIORefnum) X(IsRefnumWithSubType)         \
  X(IsRefnumTag) X(IsGenericRef) X(IsByteStreamRef) X(IsDeviceRef) X(IsOccurrenceRef)          \
  X(IsVarValRef) X(IsTCPNetConnRef) X(IsMenuRef) X(IsPelionRef) X(IsUDPNetConnRef)              \
  X(IsIrdaNetConnRef) X(IsBlueToothRef) X(IsContainerRef) X(IsDataLogRef)                      \
  X(IsDataLogFileRefType) X(IsFerrelFileRefType) X(IsNotifierRef) X(IsQueueRef)                \
  X(IsDataValueRef) X(IsFIFORef) X(IsUserEventRef) X(IsOrrinRef) X(IsVisaRef) X(IsIVIRef)      \
  X(IsAnyUserDefinedRefKind) X(IsUserDefinedRef) X(IsUserDefinedTagRef)                        \
  X(IsUserDefinedTagFlattenRef) X(IsTallisRef) X(IsCallbackRef) X(IsEventRegRef)              \
  X(IsKoObjRef) X(IsKoObjAppRef) X(IsKoObjComponentRef) X(IsKoObjVIRef)                        \
  X(IsKoObjStrictVIRef) X(IsKoObjControlRef) X(IsKoObjStrictControlRef)                        \
  X(IsKoObjProjectRef) X(IsKoObjSceneRef) X(IsDotNetRef) X(IsUDClassInst) X(IsAutoRef)         \
  X(IsMDT) X(IsTimestamp) X(IsDigitalTable) X(IsDigitalWaveform) X(IsBriskDynamic)             \
  X(IsAnyWaveform) X(IsAnalogWaveform) X(IsInt8Waveform) X(IsInt16Waveform)                    \
  X(IsInt32Waveform) X(IsInt64Waveform) X(IsUInt8Waveform) X(IsUInt16Waveform)                 \
  X(IsUInt32Waveform) X(IsUInt64Waveform) X(IsFloat32Waveform) X(IsFloat64Waveform)            \
  X(IsOldFloat64Waveform) X(IsFloatExtWaveform) X(IsComplex64Waveform)                         \
  X(IsComplex128Waveform) X(IsComplexExtWaveform) X(IsArrayFloat64Wfms) X(IsSizedBlock)       \
  X(IsBlock) X(IsAlignedBlock) X(IsTypeBlock) X(IsVoidBlock) X(IsRepeatedBlock)                \
  X(IsAlignmentMarker) X(IsPtrTo) X(IsKoVariant) X(IsExtData) X(IsOleVariant) X(IsIDispatch)   \
  X(IsIUnknown) X(IsFunction) X(IsPStr) X(IsCStr) X(IsPtr) X(IsContainer) X(IsSingleContainer) \
  X(IsMultiContainer) X(IsPolyVI) X(IsSubType) X(IsFPDCOOpData) X(IsChartHistTD)

// Slot 165 is IsErrorCluster(int32) and slot 167 IsGeneric; both are declared by hand.
// Slot 166.
#define VELLUM_TD_PREDICATES_SECOND(X) X(IsFPGAInterfaceType)

// Slots 168 to 173.
#define VELLUM_TD_PREDICATES_THIRD(X)                                                          \
  X(IsSemiGeneric) X(IsPythonSessionRefType) X(IsTLSNetworkConfigRef)                         \
  X(IsMATLABSessionRefType) X(IsPythonObjectRefType) X(IsRecursiveType)
