// SPDX-License-Identifier: Apache-2.0
// The program whose precompiled headers the test programs share; it does nothing.
int main() {
    return 0;
}
