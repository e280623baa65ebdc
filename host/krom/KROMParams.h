#pragma once
// KROM_PARAM_STRUCT declares a kernel's parameter block once and gives both
// forms: the C++ struct the tool fills in, and its text (NameText) that the
// device compiler sees, so the two can never drift apart. Fields are 32-bit
// ints and floats and arrays of them; the layout is the same on both sides.
//
//   KROM_PARAM_STRUCT(BlurParams, { float radius; int workSize[2]; })
//   -> struct BlurParams { ... };  BlurParamsText = "typedef struct {...} BlurParams;"
#define KROM_PARAM_STRUCT(Name, ...)                                                                                   \
    struct Name __VA_ARGS__;                                                                                           \
    inline constexpr char Name##Text[] = "typedef struct " #__VA_ARGS__ " " #Name ";\n";
