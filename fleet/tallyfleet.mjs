#!/usr/bin/env node
// Asks a fleet's logs; see docs/fleet.md.
import { main } from './lib/commands.mjs';

process.exitCode = await main(process.argv.slice(2));
