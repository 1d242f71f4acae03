#pragma once

#include "platform/font_directories.h"
