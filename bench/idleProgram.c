/* SPDX-License-Identifier: Apache-2.0 */
/* A program that does nothing: what is left is the cost of starting it and waiting for it. */
int main(void) {
    return 0;
}
