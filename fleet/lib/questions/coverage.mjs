// Who reported, and what was lost on the way.
import { dateOf } from '../logs.mjs';

export const summary = 'devices and logs, by day and version; lost and repeated logs';
export const parameters = {};
export const columns = ['date', 'version', 'devices', 'logs', 'lost', 'duplicates', 'conflicts', 'undated', 'bare',
  'unreadable'];
export const plot = { x: 'date', y: ['devices', 'lost'], series: 'version' };

const ALL = "'all'";

async function groupsOf({ query }, day, version) {
  const groups = new Map();
  const groupOf = (of, text) => {
    const name = `${of} ${text}`;
    if (!groups.has(name)) groups.set(name, { day: of, version: text, kept: [0, 0] });
    return groups.get(name);
  };
  for (const [of, text, state, devices, logs] of await query('coverage', { day, version })) {
    groupOf(of, text)[state] = [devices, logs];
  }
  return { groups: [...groups.values()], groupOf };
}

function rowOf({ day, version, kept, lost, duplicate, conflict, undated, bare, unreadable }, anonymity, all) {
  const told = ([devices, logs] = [0, 0]) => anonymity.count(devices, logs);
  // A log without a device may come from any of them, also all from one.
  return [day > 0 ? dateOf(day) : null, all ? null : version, anonymity.devices(kept[0]), told(kept),
    ...[lost, duplicate, conflict, undated].map(each => (all ? told(each) : null)),
    bare && all ? anonymity.count(bare[1], bare[1]) : null, unreadable && all ? unreadable[1] : null];
}

export async function answer(context) {
  const { anonymity, query } = context;
  const ofKept = ({ kept: [devices] }) => devices;
  const { groups: whole, groupOf: ofWhole } = await groupsOf(context, '-1', ALL);
  const days = await groupsOf(context, 'coalesce(day, 0)', ALL);
  for (const [day, devices, lost] of await query('gaps', { day: 'day' })) {
    days.groupOf(day, 'all').lost = [devices, lost];
  }
  for (const [, devices, lost] of await query('gaps', { day: '-1' })) {
    ofWhole(-1, 'all').lost = [devices, lost];
  }
  const dated = group => group.day > 0 && ofKept(group) > 0;
  const versions = await groupsOf(context, 'coalesce(day, 0)', "version");
  const told = [
    ...anonymity.release(whole, ofKept).map(group => rowOf(group, anonymity, true)),
    ...anonymity.release(days.groups.filter(dated), ofKept, ({ day }) => day).map(group => rowOf(group, anonymity, true)),
    ...anonymity.release(versions.groups.filter(dated), ofKept, ({ day }) => day).map(group => rowOf(group, anonymity, false)),
  ];
  const order = ([date, version]) => `${date ?? ''} ${version ?? ''}`;
  return told.sort((one, other) => (order(one) < order(other) ? -1 : 1));
}
