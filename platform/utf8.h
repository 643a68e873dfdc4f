#pragma once

#include "system/utf8.h"
