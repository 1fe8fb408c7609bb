/* SPDX-License-Identifier: Apache-2.0 */
/* Marks the names that libveldfirewall.so exports; everything else in it is hidden. */
#ifndef VELDFIREWALL_EXPORT_H
#define VELDFIREWALL_EXPORT_H

#define VELDFIREWALL_API __attribute__((visibility("default")))

#endif
